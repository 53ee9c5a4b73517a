#pragma once
// The expression language of per-pixel equations: compiled against a table of named constants into register
// bytecode that the processor runs 32 pixels at a time, and into kernel text for both device languages.

#include "host/kernel/Countable.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace Kernel {

class ExpressionParser {
public:
    // Results and constants have 1 component, or 2 to MaxComponents for vectors.
    static constexpr int MaxComponents = 6;
    // Pixels evaluated per instruction dispatch.
    static constexpr int Lanes = 32;
    // Longer texts, deeper nesting and larger programs are refused with a message.
    static constexpr std::size_t MaxTextLength = 16384;
    static constexpr int MaxNesting = 128;
    static constexpr std::size_t MaxOperations = 65536;

    // Unit categories, each of which a ParseInfo may disallow.
    enum UnitCategory : int {
        PixelLengthUnits = 1,    // px
        AngleUnits = 2,          // deg, °, rad
        PercentUnits = 3,        // %
        PhysicalLengthUnits = 4, // pt, mm, cm, in: depend on the document's resolution
    };
    static constexpr int UnitCategoryCount = 5;

    // What ConvertToNumeric turns a result into.
    enum UnitType : int {
        UnitTypePixels = 1, // a length, in pixels
        UnitTypeAngle = 2,  // an angle, in the configured angle unit
        UnitTypeNumber = 5, // any result, every unit reduced to its base value
    };

    // The result of one evaluation.
    struct Value {
        int components = 0;
        std::array<float, MaxComponents> values{};
    };

    // A named value an expression may read. A volatile one is read when the program runs, from the copy
    // that the running thread's ExecuteInfo holds; any other is read once, when the program is built.
    class Constant : public virtual Countable {
    public:
        const std::string& GetName() const noexcept { return m_Name; }
        int GetComponentCount() const noexcept { return m_Components; }
        bool IsVolatile() const noexcept { return m_Volatile; }
        double GetValue(int component = 0) const noexcept;

        // Sets component 0 (or all components) for Execute, which reads lane 0.
        void SetValue(double value) noexcept;
        void SetVector(std::span<const double> values) noexcept;
        // The per-lane values ExecuteSpan reads: Lanes floats for one component.
        float* GetLanes(int component = 0) noexcept { return m_Lanes[ClampComponent(component)].data(); }
        const float* GetLanes(int component = 0) const noexcept {
            return m_Lanes[ClampComponent(component)].data();
        }

        // A copy with the same name and values for one thread; it stands for this constant in an
        // ExecuteInfo made by CopyForThreadSession.
        Counted<Constant> CopyForThreadSession() const;
        // The constant this is a thread copy of; itself for an original.
        const Constant& GetOriginal() const noexcept { return m_Original ? *m_Original : *this; }

    private:
        friend class ExpressionParser;
        Constant(std::string name, int components, bool isVolatile);
        static int ClampComponent(int c) noexcept { return c < 0 ? 0 : c >= MaxComponents ? 0 : c; }

        std::string m_Name;
        int m_Components;
        bool m_Volatile;
        Counted<const Constant> m_Original;
        std::array<double, MaxComponents> m_Values{};
        alignas(64) std::array<std::array<float, Lanes>, MaxComponents> m_Lanes{};
    };

    // The names an expression may read, in the order they were added. Not changed while anything compiles
    // or runs against it.
    class Constants : public virtual Countable {
    public:
        // Each returns the new constant's handle, or null for a name that is not an identifier, is taken,
        // or a vector of fewer than 2 or more than MaxComponents components.
        Counted<Constant> Add(std::string_view name, double value);
        Counted<Constant> AddVolatile(std::string_view name, double value);
        Counted<Constant> AddVector(std::string_view name, std::span<const double> values,
                                    bool isVolatile = false);

        int IndexOf(std::string_view name) const noexcept;
        Counted<Constant> Find(std::string_view name) const;
        std::size_t GetCount() const noexcept { return m_Constants.size(); }
        const Counted<Constant>& Get(std::size_t index) const { return m_Constants[index]; }

        // A letter or '_', then letters, digits and '_'.
        static bool IsIdentifier(std::string_view name) noexcept;

    private:
        Counted<Constant> Insert(std::string_view name, std::span<const double> values, bool isVolatile);
        std::vector<Counted<Constant>> m_Constants;
    };

    // Turns length units into pixels at a resolution.
    class UnitConverter {
    public:
        enum class LengthUnit { Pixel, Point, Millimetre, Centimetre, Inch };
        explicit UnitConverter(double pixelsPerInch = 72.0) noexcept
            : m_PixelsPerInch(pixelsPerInch) {}
        virtual ~UnitConverter() = default;
        virtual double ToPixels(double value, LengthUnit unit) const noexcept;
        double GetPixelsPerInch() const noexcept { return m_PixelsPerInch; }

    private:
        double m_PixelsPerInch;
    };

    // Why a text did not compile: the message ends "at column N" (or "at line L, column N").
    struct Error {
        std::string message;
        int line = 0;   // 1-based; 0 when there is no error
        int column = 0; // 1-based, in characters
        std::string sourceLine;
        // The message, the offending line and a caret under the column.
        std::string Report() const;
        explicit operator bool() const noexcept { return line != 0; }
    };

    // The evaluation environment of a program: the constants table and one thread's copies of its volatile
    // constants.
    class ExecuteInfo : public virtual Countable {
    public:
        static Counted<ExecuteInfo> Create(Counted<const Constants> constants);
        // An environment that reads the given thread copies in place of their originals.
        Counted<ExecuteInfo> CopyForThreadSession(std::vector<Counted<Constant>> threadCopies) const;
        // The same, copying every volatile constant of the table itself.
        Counted<ExecuteInfo> CopyForThreadSession() const;
        // This environment's copy of a constant, or the table's own constant where it has none.
        Counted<Constant> GetThreadConstant(const Constant& constant) const;
        const Constants& GetConstants() const noexcept { return *m_Constants; }

    private:
        explicit ExecuteInfo(Counted<const Constants> constants)
            : m_Constants(std::move(constants)) {}
        Counted<const Constants> m_Constants;
        std::vector<Counted<Constant>> m_ThreadCopies;
    };

    class Program;

    // A compiled expression.
    class ByteCode : public virtual Countable {
    public:
        int GetComponentCount() const noexcept;
        // Instructions the processor runs per span (after folding); 0 for a result that is a constant.
        std::size_t GetInstructionCount() const noexcept;
        // Always false for a compiled expression; kept for callers that hold an empty one.
        bool IsEmpty() const noexcept;

        // The program with its result converted to unitType and every non-volatile constant folded in; null
        // when the result cannot be given in that unit (error says why) or info's table is not the one the
        // expression was compiled against.
        Counted<ByteCode> ConvertToNumeric(const ExecuteInfo& info, int unitType, bool acceptPlainNumbers,
                                           std::string* error = nullptr) const;

        // The body of a device function computing the expression (see GetDevicePrelude): statements ending
        // in "return ...;", whose free names are the constants it reads (a vector constant's component k is
        // name.v[k]). Empty when it cannot be expressed there: a constant's name is reserved in kernel text.
        std::string GetMetalFragment(const ExecuteInfo& info, int unitType) const;

        // One thread's evaluation state: registers, literal lanes and the addresses of the thread's
        // volatile constants. Shares nothing mutable with any other session.
        class Session {
        public:
            // Null when info's table is not the one the byte code was compiled against.
            static std::unique_ptr<Session> CreateForThread(Counted<const ByteCode> byteCode,
                                                            Counted<const ExecuteInfo> info);
            ~Session();
            Session(const Session&) = delete;
            Session& operator=(const Session&) = delete;

            // Evaluates lane 0 (the value SetValue wrote); false, never a throw, when nothing was computed.
            bool Execute(Value& result) noexcept;
            // Evaluates lanes 0 .. count - 1 (1 <= count <= Lanes); results through GetResultLanes.
            bool ExecuteSpan(int count) noexcept;
            const float* GetResultLanes(int component) const noexcept;
            int GetComponentCount() const noexcept;

        private:
            struct State;
            explicit Session(std::unique_ptr<State> state);
            std::unique_ptr<State> m_State;
        };

        const Program& GetProgram() const noexcept { return *m_Program; }

    private:
        friend class ExpressionParser;
        explicit ByteCode(std::shared_ptr<const Program> program)
            : m_Program(std::move(program)) {}
        std::shared_ptr<const Program> m_Program;
    };

    // One text to compile, with its settings.
    class ParseInfo {
    public:
        // converter may be null (72 pixels per inch); degrees makes trigonometry read and give degrees.
        ParseInfo(std::string text, const UnitConverter* converter, Counted<const Constants> constants,
                  bool degrees);
        void SetUnitCategoryAllowed(int category, bool allowed) noexcept;
        void SetIgnoreUnitTypeCase(bool ignore) noexcept { m_IgnoreUnitCase = ignore; }

        // The program, or null with GetError() saying why.
        Counted<ByteCode> Compile();
        const Error& GetError() const noexcept { return m_Error; }
        const std::string& GetText() const noexcept { return m_Text; }

    private:
        std::string m_Text;
        const UnitConverter* m_Converter;
        Counted<const Constants> m_Constants;
        bool m_Degrees;
        bool m_IgnoreUnitCase = false;
        std::array<bool, UnitCategoryCount> m_AllowedCategories{true, true, true, true, true};
        Error m_Error;
    };

    // Kernel text that defines what a fragment calls, for language 0 (CUDA C++, inside namespace
    // Expressions, with vec2 .. vec6 constructors) or 1 (OpenCL C, at file level, plain structs). Guarded,
    // so it may be pasted more than once. Null for any other language.
    static const char* GetDevicePrelude(int language) noexcept;

    // True when name can stand as a parameter in kernel text of both languages.
    static bool IsDeviceName(std::string_view name) noexcept;
};

} // namespace Kernel
