// The expression language: a single-pass parser that emits scalar SSA (vectors are split into components as
// they are parsed, constants folded, repeated work shared), a register allocator that turns the SSA into
// span bytecode, the span interpreter, and the kernel-text emitter. The parser recurses only through
// nesting, which is bounded, and everything it allocates is bounded by the text's length.
#include "host/kernel/ExpressionParser.h"

#include "host/kernel/ExpressionMath.h"
#include "host/kernel/Simd.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>
#include <map>
#include <optional>
#include <stdexcept>
#include <unordered_map>

namespace Kernel {

using namespace ExpressionMath;
using Ep = ExpressionParser;

// ---- Operations -------------------------------------------------------------------------------------------

// Every scalar operation: its name, argument count, how kernel text writes it (an infix or prefix operator,
// or a call of the shared function) and what it computes. Folding, the interpreter and the kernel text all
// come from this one list.
#define EXPRESSION_OPERATIONS(X)                                                                             \
    X(Neg, 1, Prefix, "-", -a)                                                                               \
    X(Add, 2, Infix, "+", a + b)                                                                             \
    X(Sub, 2, Infix, "-", a - b)                                                                             \
    X(Mul, 2, Infix, "*", a* b)                                                                              \
    X(Div, 2, Infix, "/", a / b)                                                                             \
    X(Mod, 2, Call, "ex_mod", ex_mod(a, b))                                                                  \
    X(Pow, 2, Call, "ex_pow", ex_pow(a, b))                                                                  \
    X(Lt, 2, Call, "ex_lt", ex_lt(a, b))                                                                     \
    X(Le, 2, Call, "ex_le", ex_le(a, b))                                                                     \
    X(Gt, 2, Call, "ex_gt", ex_gt(a, b))                                                                     \
    X(Ge, 2, Call, "ex_ge", ex_ge(a, b))                                                                     \
    X(Eq, 2, Call, "ex_eq", ex_eq(a, b))                                                                     \
    X(Ne, 2, Call, "ex_ne", ex_ne(a, b))                                                                     \
    X(And, 2, Call, "ex_and", ex_and(a, b))                                                                  \
    X(Or, 2, Call, "ex_or", ex_or(a, b))                                                                     \
    X(Not, 1, Call, "ex_not", ex_not(a))                                                                     \
    X(Select, 3, Call, "ex_select", ex_select(a, b, c))                                                      \
    X(Abs, 1, Call, "ex_abs", ex_abs(a))                                                                     \
    X(Sign, 1, Call, "ex_sign", ex_sign(a))                                                                  \
    X(Floor, 1, Call, "ex_floor", ex_floor(a))                                                               \
    X(Ceil, 1, Call, "ex_ceil", ex_ceil(a))                                                                  \
    X(Trunc, 1, Call, "ex_trunc", ex_trunc(a))                                                               \
    X(Round, 1, Call, "ex_round", ex_round(a))                                                               \
    X(Fract, 1, Call, "ex_fract", ex_fract(a))                                                               \
    X(Sqrt, 1, Call, "ex_sqrt", ex_sqrt(a))                                                                  \
    X(Sin, 1, Call, "ex_sin", ex_sin(a))                                                                     \
    X(Cos, 1, Call, "ex_cos", ex_cos(a))                                                                     \
    X(Tan, 1, Call, "ex_tan", ex_tan(a))                                                                     \
    X(Asin, 1, Call, "ex_asin", ex_asin(a))                                                                  \
    X(Acos, 1, Call, "ex_acos", ex_acos(a))                                                                  \
    X(Atan, 1, Call, "ex_atan", ex_atan(a))                                                                  \
    X(Atan2, 2, Call, "ex_atan2", ex_atan2(a, b))                                                            \
    X(Exp, 1, Call, "ex_exp", ex_exp(a))                                                                     \
    X(Log, 1, Call, "ex_log", ex_log(a))                                                                     \
    X(Log2, 1, Call, "ex_log2", ex_log2(a))                                                                  \
    X(Log10, 1, Call, "ex_log10", ex_log10(a))                                                               \
    X(Min, 2, Call, "ex_min", ex_min(a, b))                                                                  \
    X(Max, 2, Call, "ex_max", ex_max(a, b))                                                                  \
    X(Clamp, 3, Call, "ex_clamp", ex_clamp(a, b, c))                                                         \
    X(Mix, 3, Call, "ex_mix", ex_mix(a, b, c))                                                               \
    X(Step, 2, Call, "ex_step", ex_step(a, b))                                                               \
    X(Smoothstep, 3, Call, "ex_smoothstep", ex_smoothstep(a, b, c))                                          \
    X(Hypot, 2, Call, "ex_hypot", ex_hypot(a, b))                                                            \
    X(Rand, 2, Call, "ex_rand", ex_rand(a, b))                                                               \
    X(Noise, 2, Call, "ex_noise", ex_noise(a, b))                                                            \
    X(Fbm, 3, Call, "ex_fbm", ex_fbm(a, b, c))

enum class Op : std::uint8_t {
    Literal,
    Input,
#define EXPRESSION_ENUM(name, arity, form, text, expr) name,
    EXPRESSION_OPERATIONS(EXPRESSION_ENUM)
#undef EXPRESSION_ENUM
};

namespace {

enum class Form { Leaf, Prefix, Infix, Call };

struct OpInfo {
    int arity;
    Form form;
    const char* text;
};

constexpr OpInfo OpInfos[] = {{0, Form::Leaf, ""},
                              {0, Form::Leaf, ""},
#define EXPRESSION_INFO(name, arity, form, text, expr) {arity, Form::form, text},
                              EXPRESSION_OPERATIONS(EXPRESSION_INFO)
#undef EXPRESSION_INFO
};

const OpInfo& InfoOf(Op op) {
    return OpInfos[static_cast<std::size_t>(op)];
}

float Evaluate(Op op, float a, float b, float c) {
    (void)b;
    (void)c;
    switch (op) {
#define EXPRESSION_EVALUATE(name, arity, form, text, expr)                                                   \
    case Op::name:                                                                                           \
        return expr;
        EXPRESSION_OPERATIONS(EXPRESSION_EVALUATE)
#undef EXPRESSION_EVALUATE
    default:
        return 0.0f;
    }
}

} // namespace

// ---- The SSA program ------------------------------------------------------------------------------------

namespace {

constexpr std::uint32_t NoArgument = 0xffffffffu;

struct Node {
    Op op;
    std::uint8_t component = 0;
    std::uint32_t args[3] = {NoArgument, NoArgument, NoArgument};
    float value = 0.0f;         // Literal
    std::uint32_t constant = 0; // Input: index in the constants table

    bool operator==(const Node& other) const noexcept {
        return op == other.op && component == other.component && args[0] == other.args[0] &&
               args[1] == other.args[1] && args[2] == other.args[2] &&
               std::bit_cast<std::uint32_t>(value) == std::bit_cast<std::uint32_t>(other.value) &&
               constant == other.constant;
    }
};

struct NodeHash {
    std::size_t operator()(const Node& n) const noexcept {
        std::uint64_t h = static_cast<std::uint64_t>(n.op) * 0x9E3779B97F4A7C15ull;
        auto mix = [&h](std::uint64_t v) { h = (h ^ v) * 0xBF58476D1CE4E5B9ull; };
        mix(n.component);
        mix(n.args[0]);
        mix(n.args[1]);
        mix(n.args[2]);
        mix(std::bit_cast<std::uint32_t>(n.value));
        mix(n.constant);
        return static_cast<std::size_t>(h ^ (h >> 31));
    }
};

// Appends nodes in evaluation order, folding operations whose arguments are all literals and sharing nodes
// that are already there.
class NodeBuilder {
public:
    std::vector<Node> nodes;

    // Null (NoArgument) once MaxOperations nodes exist.
    std::uint32_t Literal(float v) {
        Node n{Op::Literal};
        n.value = v;
        return Intern(n);
    }
    std::uint32_t Input(std::uint32_t constant, int component) {
        Node n{Op::Input};
        n.constant = constant;
        n.component = static_cast<std::uint8_t>(component);
        return Intern(n);
    }
    std::uint32_t Emit(Op op, std::uint32_t a, std::uint32_t b = NoArgument, std::uint32_t c = NoArgument) {
        const std::uint32_t args[3] = {a, b, c};
        const int arity = InfoOf(op).arity;
        bool literal = true;
        for (int i = 0; i < arity; ++i) {
            if (args[i] == NoArgument) return NoArgument;
            literal = literal && nodes[args[i]].op == Op::Literal;
        }
        if (literal) {
            float v[3] = {0.0f, 0.0f, 0.0f};
            for (int i = 0; i < arity; ++i)
                v[i] = nodes[args[i]].value;
            return Literal(Evaluate(op, v[0], v[1], v[2]));
        }
        Node n{op};
        for (int i = 0; i < arity; ++i)
            n.args[i] = args[i];
        return Intern(n);
    }
    bool Full() const noexcept { return nodes.size() >= Ep::MaxOperations; }

private:
    std::uint32_t Intern(const Node& n) {
        const auto found = m_Index.find(n);
        if (found != m_Index.end()) return found->second;
        if (Full()) return NoArgument;
        const auto id = static_cast<std::uint32_t>(nodes.size());
        nodes.push_back(n);
        m_Index.emplace(n, id);
        return id;
    }
    std::unordered_map<Node, std::uint32_t, NodeHash> m_Index;
};

enum class Dimension : std::uint8_t { Plain, Length, Angle };

} // namespace

// Operand kinds of an instruction: a register, a literal's lanes, a volatile constant's lanes, or zeros.
enum class OperandKind : std::uint8_t { Register, Literal, Input, Zero };

struct Operand {
    OperandKind kind = OperandKind::Zero;
    std::uint32_t index = 0;
};

struct Instruction {
    Op op;
    std::uint32_t dest;
    Operand args[3];
};

// What a ByteCode holds: the SSA of the text (kept for re-folding and kernel text) and the register
// program built from it.
class ExpressionParser::Program {
public:
    Counted<const Constants> constants;
    std::vector<Node> nodes;
    int components = 1;
    std::array<std::uint32_t, MaxComponents> result{};
    Dimension dimension = Dimension::Plain;

    // The register program.
    std::vector<Instruction> code;
    std::uint32_t registers = 0;
    std::vector<float> literals;
    struct InputSlot {
        std::uint32_t constant;
        int component;
    };
    std::vector<InputSlot> inputs;
    std::array<Operand, MaxComponents> outputs{};
};

namespace {

// Rebuilds the SSA through a fresh builder, folding the values of non-volatile constants when asked, and
// scaling the result; returns the new result ids.
struct Rebuilt {
    std::vector<Node> nodes;
    std::array<std::uint32_t, Ep::MaxComponents> result{};
};

Rebuilt Refold(const Ep::Program& program, bool foldConstants, float scale) {
    NodeBuilder builder;
    std::vector<std::uint32_t> map(program.nodes.size(), NoArgument);
    for (std::size_t i = 0; i < program.nodes.size(); ++i) {
        const Node& n = program.nodes[i];
        if (n.op == Op::Literal) {
            map[i] = builder.Literal(n.value);
        } else if (n.op == Op::Input) {
            const auto& constant = program.constants->Get(n.constant);
            if (foldConstants && !constant->IsVolatile())
                map[i] = builder.Literal(static_cast<float>(constant->GetValue(n.component)));
            else
                map[i] = builder.Input(n.constant, n.component);
        } else {
            const int arity = InfoOf(n.op).arity;
            std::uint32_t args[3] = {NoArgument, NoArgument, NoArgument};
            for (int a = 0; a < arity; ++a)
                args[a] = map[n.args[a]];
            map[i] = builder.Emit(n.op, args[0], args[1], args[2]);
        }
    }
    Rebuilt out;
    for (int c = 0; c < program.components; ++c) {
        std::uint32_t id = map[program.result[c]];
        if (scale != 1.0f) id = builder.Emit(Op::Mul, id, builder.Literal(scale));
        out.result[c] = id;
    }
    out.nodes = std::move(builder.nodes);
    return out;
}

// Marks the nodes the result depends on.
std::vector<bool> LiveNodes(const std::vector<Node>& nodes, const std::uint32_t* result, int components) {
    std::vector<bool> live(nodes.size(), false);
    for (int c = 0; c < components; ++c)
        live[result[c]] = true;
    for (std::size_t i = nodes.size(); i-- > 0;) {
        if (!live[i]) continue;
        const int arity = InfoOf(nodes[i].op).arity;
        for (int a = 0; a < arity; ++a)
            live[nodes[i].args[a]] = true;
    }
    return live;
}

// Builds the register program of rebuilt SSA: literals and constants become operands of their own, every
// other live node one instruction, and a register is reused once its last reader has read it.
void Allocate(Ep::Program& program, const Rebuilt& rebuilt) {
    const auto& nodes = rebuilt.nodes;
    const auto live = LiveNodes(nodes, rebuilt.result.data(), program.components);
    constexpr std::size_t Forever = std::numeric_limits<std::size_t>::max();
    std::vector<std::size_t> lastUse(nodes.size(), 0);
    for (std::size_t i = 0; i < nodes.size(); ++i) {
        if (!live[i]) continue;
        const int arity = InfoOf(nodes[i].op).arity;
        for (int a = 0; a < arity; ++a)
            lastUse[nodes[i].args[a]] = i;
    }
    for (int c = 0; c < program.components; ++c)
        lastUse[rebuilt.result[c]] = Forever;

    std::vector<Operand> where(nodes.size());
    std::vector<std::uint32_t> freeRegisters;
    std::map<std::pair<std::uint32_t, int>, std::uint32_t> inputSlots;
    std::unordered_map<std::uint32_t, std::uint32_t> literalSlots;
    program.code.clear();
    program.literals.clear();
    program.inputs.clear();
    program.registers = 0;
    for (std::size_t i = 0; i < nodes.size(); ++i) {
        if (!live[i]) continue;
        const Node& n = nodes[i];
        if (n.op == Op::Literal) {
            const auto bits = std::bit_cast<std::uint32_t>(n.value);
            auto [slot, added] =
                literalSlots.emplace(bits, static_cast<std::uint32_t>(program.literals.size()));
            if (added) program.literals.push_back(n.value);
            where[i] = {OperandKind::Literal, slot->second};
            continue;
        }
        if (n.op == Op::Input) {
            auto [slot, added] = inputSlots.emplace(std::make_pair(n.constant, int(n.component)),
                                                    static_cast<std::uint32_t>(program.inputs.size()));
            if (added) program.inputs.push_back({n.constant, n.component});
            where[i] = {OperandKind::Input, slot->second};
            continue;
        }
        Instruction in{n.op, 0, {}};
        const int arity = InfoOf(n.op).arity;
        for (int a = 0; a < arity; ++a)
            in.args[a] = where[n.args[a]];
        // Registers whose last reader this is are free for the result (same-lane reads come first).
        for (int a = 0; a < arity; ++a) {
            const auto arg = n.args[a];
            bool repeated = false;
            for (int b = 0; b < a; ++b)
                repeated = repeated || n.args[b] == arg;
            if (!repeated && lastUse[arg] == i && where[arg].kind == OperandKind::Register)
                freeRegisters.push_back(where[arg].index);
        }
        std::uint32_t reg;
        if (!freeRegisters.empty()) {
            reg = freeRegisters.back();
            freeRegisters.pop_back();
        } else {
            reg = program.registers++;
        }
        in.dest = reg;
        where[i] = {OperandKind::Register, reg};
        program.code.push_back(in);
    }
    for (int c = 0; c < program.components; ++c)
        program.outputs[c] = where[rebuilt.result[c]];
}

} // namespace

// ---- Constants
// ---------------------------------------------------------------------------------------------

Ep::Constant::Constant(std::string name, int components, bool isVolatile)
    : m_Name(std::move(name))
    , m_Components(components)
    , m_Volatile(isVolatile) {}

double Ep::Constant::GetValue(int component) const noexcept {
    return component >= 0 && component < m_Components ? m_Values[component] : 0.0;
}

void Ep::Constant::SetValue(double value) noexcept {
    for (int c = 0; c < (m_Components == 1 ? 1 : m_Components); ++c) {
        m_Values[c] = value;
        m_Lanes[c][0] = static_cast<float>(value);
    }
}

void Ep::Constant::SetVector(std::span<const double> values) noexcept {
    for (int c = 0; c < m_Components; ++c) {
        const double v = c < static_cast<int>(values.size()) ? values[c] : 0.0;
        m_Values[c] = v;
        m_Lanes[c].fill(static_cast<float>(v));
    }
}

Counted<Ep::Constant> Ep::Constant::CopyForThreadSession() const {
    Counted<Constant> copy(new Constant(m_Name, m_Components, m_Volatile));
    copy->m_Original = Counted<const Constant>(&GetOriginal());
    copy->m_Values = m_Values;
    copy->m_Lanes = m_Lanes;
    return copy;
}

bool Ep::Constants::IsIdentifier(std::string_view name) noexcept {
    if (name.empty()) return false;
    auto letter = [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_'; };
    if (!letter(name[0])) return false;
    for (char c : name)
        if (!letter(c) && !(c >= '0' && c <= '9')) return false;
    return true;
}

int Ep::Constants::IndexOf(std::string_view name) const noexcept {
    for (std::size_t i = 0; i < m_Constants.size(); ++i)
        if (m_Constants[i]->GetName() == name) return static_cast<int>(i);
    return -1;
}

Counted<Ep::Constant> Ep::Constants::Find(std::string_view name) const {
    const int i = IndexOf(name);
    return i < 0 ? Counted<Constant>() : m_Constants[i];
}

Counted<Ep::Constant> Ep::Constants::Insert(std::string_view name, std::span<const double> values,
                                            bool isVolatile) {
    if (!IsIdentifier(name) || IndexOf(name) >= 0 || values.empty() ||
        values.size() > static_cast<std::size_t>(MaxComponents))
        return {};
    Counted<Constant> constant(new Constant(std::string(name), static_cast<int>(values.size()), isVolatile));
    constant->SetVector(values);
    m_Constants.push_back(constant);
    return constant;
}

Counted<Ep::Constant> Ep::Constants::Add(std::string_view name, double value) {
    return Insert(name, std::span<const double>(&value, 1), false);
}

Counted<Ep::Constant> Ep::Constants::AddVolatile(std::string_view name, double value) {
    return Insert(name, std::span<const double>(&value, 1), true);
}

Counted<Ep::Constant> Ep::Constants::AddVector(std::string_view name, std::span<const double> values,
                                               bool isVolatile) {
    if (values.size() < 2) return {};
    return Insert(name, values, isVolatile);
}

double Ep::UnitConverter::ToPixels(double value, LengthUnit unit) const noexcept {
    switch (unit) {
    case LengthUnit::Pixel:
        return value;
    case LengthUnit::Point:
        return value * m_PixelsPerInch / 72.0;
    case LengthUnit::Millimetre:
        return value * m_PixelsPerInch / 25.4;
    case LengthUnit::Centimetre:
        return value * m_PixelsPerInch / 2.54;
    case LengthUnit::Inch:
        return value * m_PixelsPerInch;
    }
    return value;
}

// ---- Execute info
// ------------------------------------------------------------------------------------------

Counted<Ep::ExecuteInfo> Ep::ExecuteInfo::Create(Counted<const Constants> constants) {
    if (!constants) constants = Counted<const Constants>(new Constants);
    return Counted<ExecuteInfo>(new ExecuteInfo(std::move(constants)));
}

Counted<Ep::ExecuteInfo> Ep::ExecuteInfo::CopyForThreadSession(std::vector<Counted<Constant>> copies) const {
    Counted<ExecuteInfo> info(new ExecuteInfo(m_Constants));
    for (auto& copy : copies)
        if (copy) info->m_ThreadCopies.push_back(std::move(copy));
    return info;
}

Counted<Ep::ExecuteInfo> Ep::ExecuteInfo::CopyForThreadSession() const {
    std::vector<Counted<Constant>> copies;
    for (std::size_t i = 0; i < m_Constants->GetCount(); ++i) {
        const auto& constant = m_Constants->Get(i);
        if (constant->IsVolatile()) copies.push_back(constant->CopyForThreadSession());
    }
    return CopyForThreadSession(std::move(copies));
}

Counted<Ep::Constant> Ep::ExecuteInfo::GetThreadConstant(const Constant& constant) const {
    const Constant* original = &constant.GetOriginal();
    for (const auto& copy : m_ThreadCopies)
        if (&copy->GetOriginal() == original) return copy;
    for (std::size_t i = 0; i < m_Constants->GetCount(); ++i)
        if (m_Constants->Get(i).Get() == original) return m_Constants->Get(i);
    return {};
}

// ---- Errors
// ------------------------------------------------------------------------------------------------

std::string Ep::Error::Report() const {
    if (!*this) return {};
    std::string caret(static_cast<std::size_t>(std::max(column - 1, 0)), ' ');
    // Tabs stay tabs, so that the caret lines up under them.
    std::size_t i = 0, chars = 0;
    while (i < sourceLine.size() && chars + 1 < static_cast<std::size_t>(column)) {
        const unsigned char ch = static_cast<unsigned char>(sourceLine[i]);
        if ((ch & 0xC0) != 0x80) {
            if (ch == '\t') caret[chars] = '\t';
            ++chars;
        }
        ++i;
    }
    return message + "\n" + sourceLine + "\n" + caret + "^";
}

// ---- Parser
// ------------------------------------------------------------------------------------------------

namespace {

struct CompileError : std::exception {
    std::string message;
    std::size_t offset;
    CompileError(std::string m, std::size_t o)
        : message(std::move(m))
        , offset(o) {}
};

enum class Tok {
    End,
    Number,
    Name,
    Plus,
    Minus,
    Star,
    Slash,
    Percent,
    Caret,
    LParen,
    RParen,
    LBracket,
    RBracket,
    Comma,
    Semicolon,
    Question,
    Colon,
    Dot,
    Bang,
    Less,
    LessEqual,
    Greater,
    GreaterEqual,
    EqualEqual,
    NotEqual,
    AndAnd,
    OrOr,
    Assign,
};

struct Token {
    Tok kind;
    std::size_t offset;
    std::size_t length;
    double number = 0.0; // Number: the value with its unit applied
    Dimension dimension = Dimension::Plain;
};

// A parsed value: one SSA id per component.
struct Val {
    int n = 1;
    std::array<std::uint32_t, Ep::MaxComponents> id{};
    Dimension dim = Dimension::Plain;
    std::size_t offset = 0; // where it starts in the text, for messages
};

struct FunctionInfo {
    enum Kind {
        Componentwise, // op applied per component, scalars broadcast
        Trig,          // argument in the configured angle unit
        InverseTrig,   // result in the configured angle unit
        Atan,          // 1 argument: atan; 2: atan2
        Vector,        // vecN
        Length,
        Dot,
        Cross,
        Normalize,
        Distance,
        Rand,
        Fbm,
    };
    Kind kind;
    Op op;
    int minArgs;
    int maxArgs;
    int size = 0; // vecN: N
};

const std::map<std::string_view, FunctionInfo>& Functions() {
    using F = FunctionInfo;
    static const std::map<std::string_view, FunctionInfo> table{
        {"sin", {F::Trig, Op::Sin, 1, 1}},
        {"cos", {F::Trig, Op::Cos, 1, 1}},
        {"tan", {F::Trig, Op::Tan, 1, 1}},
        {"asin", {F::InverseTrig, Op::Asin, 1, 1}},
        {"acos", {F::InverseTrig, Op::Acos, 1, 1}},
        {"atan", {F::Atan, Op::Atan, 1, 2}},
        {"atan2", {F::InverseTrig, Op::Atan2, 2, 2}},
        {"sqrt", {F::Componentwise, Op::Sqrt, 1, 1}},
        {"pow", {F::Componentwise, Op::Pow, 2, 2}},
        {"exp", {F::Componentwise, Op::Exp, 1, 1}},
        {"log", {F::Componentwise, Op::Log, 1, 1}},
        {"log2", {F::Componentwise, Op::Log2, 1, 1}},
        {"log10", {F::Componentwise, Op::Log10, 1, 1}},
        {"abs", {F::Componentwise, Op::Abs, 1, 1}},
        {"sign", {F::Componentwise, Op::Sign, 1, 1}},
        {"floor", {F::Componentwise, Op::Floor, 1, 1}},
        {"ceil", {F::Componentwise, Op::Ceil, 1, 1}},
        {"round", {F::Componentwise, Op::Round, 1, 1}},
        {"trunc", {F::Componentwise, Op::Trunc, 1, 1}},
        {"fract", {F::Componentwise, Op::Fract, 1, 1}},
        {"mod", {F::Componentwise, Op::Mod, 2, 2}},
        {"min", {F::Componentwise, Op::Min, 2, 2}},
        {"max", {F::Componentwise, Op::Max, 2, 2}},
        {"clamp", {F::Componentwise, Op::Clamp, 3, 3}},
        {"mix", {F::Componentwise, Op::Mix, 3, 3}},
        {"lerp", {F::Componentwise, Op::Mix, 3, 3}},
        {"step", {F::Componentwise, Op::Step, 2, 2}},
        {"smoothstep", {F::Componentwise, Op::Smoothstep, 3, 3}},
        {"hypot", {F::Componentwise, Op::Hypot, 2, 2}},
        {"rand", {F::Rand, Op::Rand, 1, 2}},
        {"noise", {F::Componentwise, Op::Noise, 2, 2}},
        {"fbm", {F::Fbm, Op::Fbm, 2, 3}},
        {"vec2", {F::Vector, Op::Literal, 1, 2, 2}},
        {"vec3", {F::Vector, Op::Literal, 1, 3, 3}},
        {"vec4", {F::Vector, Op::Literal, 1, 4, 4}},
        {"vec5", {F::Vector, Op::Literal, 1, 5, 5}},
        {"vec6", {F::Vector, Op::Literal, 1, 6, 6}},
        {"length", {F::Length, Op::Literal, 1, 1}},
        {"dot", {F::Dot, Op::Literal, 2, 2}},
        {"cross", {F::Cross, Op::Literal, 2, 2}},
        {"normalize", {F::Normalize, Op::Literal, 1, 1}},
        {"distance", {F::Distance, Op::Literal, 2, 2}},
    };
    return table;
}

constexpr double Pi = 3.14159265358979323846;

// A name as a message quotes it: long names are cut.
std::string Quote(std::string_view name) {
    return "\"" + std::string(name.substr(0, 40)) + (name.size() > 40 ? "...\"" : "\"");
}

std::string Plural(int n, const char* word) {
    return std::to_string(n) + " " + word + (n == 1 ? "" : "s");
}

class Parser {
public:
    Parser(const std::string& text, const Ep::UnitConverter& converter, const Ep::Constants& constants,
           bool degrees, bool ignoreUnitCase, const std::array<bool, Ep::UnitCategoryCount>& allowed)
        : m_Text(text)
        , m_Converter(converter)
        , m_Constants(constants)
        , m_Degrees(degrees)
        , m_IgnoreUnitCase(ignoreUnitCase)
        , m_Allowed(allowed) {}

    // Throws CompileError; the caller turns it into an Error.
    Val Run() {
        if (m_Text.size() > Ep::MaxTextLength)
            throw CompileError("expression is longer than " + std::to_string(Ep::MaxTextLength) +
                                   " characters",
                               Ep::MaxTextLength);
        Tokenise();
        Val last;
        bool any = false;
        while (true) {
            if (Peek().kind == Tok::Semicolon) {
                Next();
                continue;
            }
            if (Peek().kind == Tok::End) break;
            last = Statement();
            any = true;
            if (Peek().kind == Tok::Semicolon) continue;
            if (Peek().kind != Tok::End) Unexpected(Peek());
        }
        if (!any) throw CompileError("empty expression", m_Text.size());
        return last;
    }

    NodeBuilder builder;

private:
    // -- Tokens
    void Tokenise() {
        std::size_t i = 0;
        const std::string& t = m_Text;
        auto isDigit = [](char c) { return c >= '0' && c <= '9'; };
        auto isLetter = [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_'; };
        while (true) {
            while (i < t.size() && (t[i] == ' ' || t[i] == '\t' || t[i] == '\n' || t[i] == '\r'))
                ++i;
            if (i >= t.size()) break;
            const std::size_t start = i;
            const char c = t[i];
            if (isDigit(c) || (c == '.' && i + 1 < t.size() && isDigit(t[i + 1]))) {
                m_Tokens.push_back(NumberToken(i));
                continue;
            }
            if (isLetter(c)) {
                while (i < t.size() && (isLetter(t[i]) || isDigit(t[i])))
                    ++i;
                m_Tokens.push_back({Tok::Name, start, i - start});
                continue;
            }
            auto two = [&](char second) { return i + 1 < t.size() && t[i + 1] == second; };
            Tok kind;
            std::size_t length = 1;
            switch (c) {
            case '+':
                kind = Tok::Plus;
                break;
            case '-':
                kind = Tok::Minus;
                break;
            case '*':
                kind = Tok::Star;
                break;
            case '/':
                kind = Tok::Slash;
                break;
            case '%':
                kind = Tok::Percent;
                break;
            case '^':
                kind = Tok::Caret;
                break;
            case '(':
                kind = Tok::LParen;
                break;
            case ')':
                kind = Tok::RParen;
                break;
            case '[':
                kind = Tok::LBracket;
                break;
            case ']':
                kind = Tok::RBracket;
                break;
            case ',':
                kind = Tok::Comma;
                break;
            case ';':
                kind = Tok::Semicolon;
                break;
            case '?':
                kind = Tok::Question;
                break;
            case ':':
                kind = Tok::Colon;
                break;
            case '.':
                kind = Tok::Dot;
                break;
            case '!':
                kind = two('=') ? Tok::NotEqual : Tok::Bang;
                length = two('=') ? 2 : 1;
                break;
            case '<':
                kind = two('=') ? Tok::LessEqual : Tok::Less;
                length = two('=') ? 2 : 1;
                break;
            case '>':
                kind = two('=') ? Tok::GreaterEqual : Tok::Greater;
                length = two('=') ? 2 : 1;
                break;
            case '=':
                kind = two('=') ? Tok::EqualEqual : Tok::Assign;
                length = two('=') ? 2 : 1;
                break;
            case '&':
                if (!two('&')) throw CompileError("expected \"&&\"", i);
                kind = Tok::AndAnd;
                length = 2;
                break;
            case '|':
                if (!two('|')) throw CompileError("expected \"||\"", i);
                kind = Tok::OrOr;
                length = 2;
                break;
            default:
                throw CompileError("unexpected character " + Describe(i), i);
            }
            m_Tokens.push_back({kind, start, length});
            i += length;
        }
        m_Tokens.push_back({Tok::End, t.size(), 0});
    }

    // "x" for a printable character, else its code point as U+XXXX.
    std::string Describe(std::size_t i) const {
        const unsigned char c = static_cast<unsigned char>(m_Text[i]);
        if (c >= 0x20 && c < 0x7f) return "\"" + std::string(1, static_cast<char>(c)) + "\"";
        char buffer[16];
        std::snprintf(buffer, sizeof buffer, "0x%02X", c);
        return buffer;
    }

    Token NumberToken(std::size_t& i) {
        const std::string& t = m_Text;
        const std::size_t start = i;
        auto isDigit = [](char c) { return c >= '0' && c <= '9'; };
        while (i < t.size() && isDigit(t[i]))
            ++i;
        if (i < t.size() && t[i] == '.') {
            ++i;
            while (i < t.size() && isDigit(t[i]))
                ++i;
        }
        bool negativeExponent = false;
        if (i < t.size() && (t[i] == 'e' || t[i] == 'E')) {
            std::size_t j = i + 1;
            if (j < t.size() && (t[j] == '+' || t[j] == '-')) {
                negativeExponent = t[j] == '-';
                ++j;
            }
            if (j < t.size() && isDigit(t[j])) {
                i = j;
                while (i < t.size() && isDigit(t[i]))
                    ++i;
            } else {
                negativeExponent = false;
            }
        }
        double value = 0.0;
        const auto parsed = std::from_chars(t.data() + start, t.data() + i, value);
        const std::string literal = t.substr(start, std::min<std::size_t>(i - start, 40));
        if (parsed.ec == std::errc::result_out_of_range) {
            if (!negativeExponent) throw CompileError("number \"" + literal + "\" is out of range", start);
            value = 0.0;
        } else if (parsed.ec != std::errc() || parsed.ptr != t.data() + i) {
            throw CompileError("malformed number \"" + literal + "\"", start);
        }
        Token token{Tok::Number, start, 0, value};
        // A unit follows without a space: letters, or the degree sign.
        const std::size_t unitStart = i;
        auto isLetter = [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_'; };
        if (i + 1 < t.size() && static_cast<unsigned char>(t[i]) == 0xC2 &&
            static_cast<unsigned char>(t[i + 1]) == 0xB0) {
            i += 2;
        } else if (i < t.size() && isLetter(t[i])) {
            while (i < t.size() && (isLetter(t[i]) || isDigit(t[i])))
                ++i;
        } else if (i < t.size() && t[i] == '%' && PercentFollows(i + 1)) {
            ++i;
        }
        if (i > unitStart) ApplyUnit(token, t.substr(unitStart, i - unitStart), unitStart);
        if (!std::isfinite(token.number) || std::fabs(token.number) > std::numeric_limits<float>::max())
            throw CompileError("number \"" + t.substr(start, std::min<std::size_t>(i - start, 40)) +
                                   "\" is out of range",
                               start);
        token.length = i - start;
        return token;
    }

    // A '%' right after a number is a percent sign unless an operand follows it.
    bool PercentFollows(std::size_t i) const {
        while (i < m_Text.size() &&
               (m_Text[i] == ' ' || m_Text[i] == '\t' || m_Text[i] == '\n' || m_Text[i] == '\r'))
            ++i;
        if (i >= m_Text.size()) return true;
        const char c = m_Text[i];
        const bool operandStart = (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') ||
                                  (c >= 'A' && c <= 'Z') || c == '_' || c == '.' || c == '(' ||
                                  (c == '!' && !(i + 1 < m_Text.size() && m_Text[i + 1] == '='));
        return !operandStart;
    }

    void ApplyUnit(Token& token, const std::string& unit, std::size_t offset) {
        struct UnitInfo {
            const char* name;
            int category;
        };
        static constexpr UnitInfo Units[] = {
            {"px", Ep::PixelLengthUnits},    {"pt", Ep::PhysicalLengthUnits}, {"mm", Ep::PhysicalLengthUnits},
            {"cm", Ep::PhysicalLengthUnits}, {"in", Ep::PhysicalLengthUnits}, {"deg", Ep::AngleUnits},
            {"\xC2\xB0", Ep::AngleUnits},    {"rad", Ep::AngleUnits},         {"%", Ep::PercentUnits}};
        auto same = [this](std::string_view a, std::string_view b) {
            if (a.size() != b.size()) return false;
            for (std::size_t k = 0; k < a.size(); ++k) {
                char x = a[k], y = b[k];
                if (m_IgnoreUnitCase) {
                    if (x >= 'A' && x <= 'Z') x = static_cast<char>(x - 'A' + 'a');
                    if (y >= 'A' && y <= 'Z') y = static_cast<char>(y - 'A' + 'a');
                }
                if (x != y) return false;
            }
            return true;
        };
        const UnitInfo* found = nullptr;
        for (const auto& u : Units)
            if (same(unit, u.name)) found = &u;
        if (!found) throw CompileError("unknown unit " + Quote(unit), offset);
        if (!m_Allowed[found->category])
            throw CompileError("unit \"" + unit + "\" is not allowed here", offset);
        using L = Ep::UnitConverter::LengthUnit;
        const std::string_view name = found->name;
        double& v = token.number;
        if (found->category == Ep::PixelLengthUnits || found->category == Ep::PhysicalLengthUnits) {
            const L length = name == "px"   ? L::Pixel
                             : name == "pt" ? L::Point
                             : name == "mm" ? L::Millimetre
                             : name == "cm" ? L::Centimetre
                                            : L::Inch;
            v = m_Converter.ToPixels(v, length);
            token.dimension = Dimension::Length;
        } else if (found->category == Ep::AngleUnits) {
            const bool inRadians = name == "rad";
            if (m_Degrees && inRadians) v = v * 180.0 / Pi;
            if (!m_Degrees && !inRadians) v = v * Pi / 180.0;
            token.dimension = Dimension::Angle;
        } else {
            v = v / 100.0;
        }
    }

    const Token& Peek() const { return m_Tokens[m_Position]; }
    const Token& Next() { return m_Tokens[m_Position < m_Tokens.size() - 1 ? m_Position++ : m_Position]; }
    std::string_view TextOf(const Token& t) const {
        return std::string_view(m_Text).substr(t.offset, t.length);
    }

    [[noreturn]] void Unexpected(const Token& t) const {
        if (t.kind == Tok::End) throw CompileError("unexpected end of expression", t.offset);
        std::string text(TextOf(t).substr(0, 40));
        throw CompileError("unexpected \"" + text + "\"", t.offset);
    }
    void Expect(Tok kind, const char* text) {
        if (Peek().kind != kind) throw CompileError(std::string("expected \"") + text + "\"", Peek().offset);
        Next();
    }

    // Every recursion passes through here.
    struct Depth {
        Parser& parser;
        Depth(Parser& p, std::size_t offset)
            : parser(p) {
            if (++parser.m_Depth > Ep::MaxNesting)
                throw CompileError("nesting deeper than " + std::to_string(Ep::MaxNesting) + " levels",
                                   offset);
        }
        ~Depth() { --parser.m_Depth; }
    };

    // -- Building values
    std::uint32_t Checked(std::uint32_t id, std::size_t offset) {
        if (id == NoArgument) throw CompileError("expression is too large", offset);
        return id;
    }
    Val Scalar(std::uint32_t id, std::size_t offset, Dimension dim = Dimension::Plain) {
        Val v;
        v.n = 1;
        v.id[0] = Checked(id, offset);
        v.dim = dim;
        v.offset = offset;
        return v;
    }
    Val LiteralValue(float value, std::size_t offset) { return Scalar(builder.Literal(value), offset); }

    // Applies op per component; scalars are broadcast; vectors must agree in size.
    Val Map(Op op, std::initializer_list<const Val*> args, std::size_t offset, Dimension dim) {
        int n = 1;
        for (const Val* a : args) {
            if (a->n == 1) continue;
            if (n != 1 && a->n != n)
                throw CompileError("operands have " + std::to_string(n) + " and " + std::to_string(a->n) +
                                       " components",
                                   offset);
            n = a->n;
        }
        Val out;
        out.n = n;
        out.dim = dim;
        out.offset = offset;
        for (int c = 0; c < n; ++c) {
            std::uint32_t ids[3] = {NoArgument, NoArgument, NoArgument};
            int k = 0;
            for (const Val* a : args)
                ids[k++] = a->id[a->n == 1 ? 0 : c];
            out.id[c] = Checked(builder.Emit(op, ids[0], ids[1], ids[2]), offset);
        }
        return out;
    }
    Val MapScalarOnly(Op op, const Val& a, const Val& b, std::size_t offset, const char* what) {
        if (a.n != 1 || b.n != 1)
            throw CompileError(std::string(what) + " needs numbers, not vectors", offset);
        return Map(op, {&a, &b}, offset, Dimension::Plain);
    }
    static Dimension Combine(Dimension a, Dimension b) {
        if (a == b) return a;
        if (a == Dimension::Plain) return b;
        if (b == Dimension::Plain) return a;
        return Dimension::Plain;
    }
    std::uint32_t Multiply(std::uint32_t a, float factor, std::size_t offset) {
        return Checked(builder.Emit(Op::Mul, a, Checked(builder.Literal(factor), offset)), offset);
    }

    // -- Grammar
    Val Statement() {
        const Token& first = Peek();
        if (first.kind == Tok::Name && m_Tokens[m_Position + 1].kind == Tok::Assign) {
            const std::string name(TextOf(first));
            if (Functions().count(name) || name == "pi" || name == "tau" || name == "e")
                throw CompileError("cannot assign to \"" + name + "\", a built-in name", first.offset);
            if (m_Constants.IndexOf(name) >= 0 && !m_Locals.count(name))
                throw CompileError("cannot assign to constant " + Quote(name), first.offset);
            Next();
            Next();
            Val v = Ternary();
            if (m_Locals.size() >= 4096 && !m_Locals.count(name))
                throw CompileError("too many local variables", first.offset);
            m_Locals[name] = v;
            return v;
        }
        return Ternary();
    }

    Val Ternary() {
        Depth depth(*this, Peek().offset);
        Val condition = Or();
        if (Peek().kind != Tok::Question) return condition;
        const Token& question = Next();
        if (condition.n != 1)
            throw CompileError("a condition must be a number, not a vector", condition.offset);
        Val yes = Ternary();
        Expect(Tok::Colon, ":");
        Val no = Ternary();
        return Map(Op::Select, {&condition, &yes, &no}, question.offset, Combine(yes.dim, no.dim));
    }

    Val Or() {
        Val left = And();
        while (Peek().kind == Tok::OrOr) {
            const Token& op = Next();
            Val right = And();
            left = MapScalarOnly(Op::Or, left, right, op.offset, "\"||\"");
        }
        return left;
    }
    Val And() {
        Val left = Equality();
        while (Peek().kind == Tok::AndAnd) {
            const Token& op = Next();
            Val right = Equality();
            left = MapScalarOnly(Op::And, left, right, op.offset, "\"&&\"");
        }
        return left;
    }
    Val Equality() {
        Val left = Relational();
        while (Peek().kind == Tok::EqualEqual || Peek().kind == Tok::NotEqual) {
            const Token& op = Next();
            Val right = Relational();
            const bool eq = op.kind == Tok::EqualEqual;
            left = MapScalarOnly(eq ? Op::Eq : Op::Ne, left, right, op.offset, eq ? "\"==\"" : "\"!=\"");
        }
        return left;
    }
    Val Relational() {
        Val left = Additive();
        while (true) {
            const Tok k = Peek().kind;
            const Op op = k == Tok::Less           ? Op::Lt
                          : k == Tok::LessEqual    ? Op::Le
                          : k == Tok::Greater      ? Op::Gt
                          : k == Tok::GreaterEqual ? Op::Ge
                                                   : Op::Literal;
            if (op == Op::Literal) return left;
            const Token& token = Next();
            Val right = Additive();
            left = MapScalarOnly(op, left, right, token.offset, "a comparison");
        }
    }
    Val Additive() {
        Val left = Multiplicative();
        while (Peek().kind == Tok::Plus || Peek().kind == Tok::Minus) {
            const Token& op = Next();
            Val right = Multiplicative();
            left = Map(op.kind == Tok::Plus ? Op::Add : Op::Sub, {&left, &right}, op.offset,
                       Combine(left.dim, right.dim));
        }
        return left;
    }
    Val Multiplicative() {
        Val left = Unary();
        while (Peek().kind == Tok::Star || Peek().kind == Tok::Slash || Peek().kind == Tok::Percent) {
            const Token& op = Next();
            Val right = Unary();
            if (op.kind == Tok::Star) {
                const Dimension d = left.dim == Dimension::Plain    ? right.dim
                                    : right.dim == Dimension::Plain ? left.dim
                                                                    : Dimension::Plain;
                left = Map(Op::Mul, {&left, &right}, op.offset, d);
            } else if (op.kind == Tok::Slash) {
                const Dimension d = right.dim == Dimension::Plain ? left.dim : Dimension::Plain;
                left = Map(Op::Div, {&left, &right}, op.offset, d);
            } else {
                left = Map(Op::Mod, {&left, &right}, op.offset, Combine(left.dim, right.dim));
            }
        }
        return left;
    }
    Val Unary() {
        const Token& t = Peek();
        if (t.kind == Tok::Minus || t.kind == Tok::Plus || t.kind == Tok::Bang) {
            Depth depth(*this, t.offset);
            Next();
            Val operand = Unary();
            if (t.kind == Tok::Plus) return operand;
            if (t.kind == Tok::Minus) return Map(Op::Neg, {&operand}, t.offset, operand.dim);
            if (operand.n != 1) throw CompileError("\"!\" needs a number, not a vector", t.offset);
            return Map(Op::Not, {&operand}, t.offset, Dimension::Plain);
        }
        return Power();
    }
    // Binds tighter than unary minus (-2^2 is -4) and to the right (2^3^2 is 2^9).
    Val Power() {
        Val base = Postfix();
        if (Peek().kind != Tok::Caret) return base;
        const Token& op = Next();
        Depth depth(*this, op.offset);
        Val exponent = Unary();
        return Map(Op::Pow, {&base, &exponent}, op.offset, Dimension::Plain);
    }

    Val Postfix() {
        Val v = Primary();
        while (true) {
            if (Peek().kind == Tok::Dot) {
                const Token& dot = Next();
                const Token& name = Peek();
                if (name.kind != Tok::Name)
                    throw CompileError("expected a component after \".\"", name.offset);
                Next();
                v = Swizzle(v, TextOf(name), dot.offset);
            } else if (Peek().kind == Tok::LBracket) {
                const Token& open = Next();
                Val index = Ternary();
                Expect(Tok::RBracket, "]");
                const Node& node = builder.nodes[index.id[0]];
                const float i = node.value;
                if (index.n != 1 || node.op != Op::Literal || !(i >= 0.0f) || i != std::floor(i) ||
                    i >= static_cast<float>(v.n))
                    throw CompileError("an index must be a whole number from 0 to " + std::to_string(v.n - 1),
                                       index.offset);
                Val out;
                out.n = 1;
                out.id[0] = v.id[static_cast<int>(i)];
                out.dim = v.dim;
                out.offset = open.offset;
                v = out;
            } else {
                return v;
            }
        }
    }

    Val Swizzle(const Val& v, std::string_view names, std::size_t offset) {
        if (names.size() > static_cast<std::size_t>(Ep::MaxComponents))
            throw CompileError("too many components in \"." + std::string(names) + "\"", offset);
        Val out;
        out.n = static_cast<int>(names.size());
        out.dim = v.dim;
        out.offset = v.offset;
        for (std::size_t k = 0; k < names.size(); ++k) {
            const char c = names[k];
            const int index = c == 'x' ? 0 : c == 'y' ? 1 : c == 'z' ? 2 : c == 'w' ? 3 : -1;
            if (index < 0)
                throw CompileError("unknown component \"." + std::string(names) + "\"", offset + 1);
            if (index >= v.n)
                throw CompileError("component \"." + std::string(1, c) + "\" of a value with " +
                                       Plural(v.n, "component"),
                                   offset + 1);
            out.id[k] = v.id[index];
        }
        return out;
    }

    Val Primary() {
        const Token& t = Peek();
        switch (t.kind) {
        case Tok::Number: {
            Next();
            Val v = LiteralValue(static_cast<float>(t.number), t.offset);
            v.dim = t.dimension;
            return v;
        }
        case Tok::LParen: {
            Next();
            Val v = Ternary();
            Expect(Tok::RParen, ")");
            v.offset = t.offset;
            return v;
        }
        case Tok::Name: {
            Next();
            const std::string name(TextOf(t));
            if (Peek().kind == Tok::LParen) return Call(name, t.offset);
            return Variable(name, t.offset);
        }
        default:
            Unexpected(t);
        }
    }

    Val Variable(const std::string& name, std::size_t offset) {
        if (const auto local = m_Locals.find(name); local != m_Locals.end()) {
            Val v = local->second;
            v.offset = offset;
            return v;
        }
        const int index = m_Constants.IndexOf(name);
        if (index >= 0) {
            const auto& constant = m_Constants.Get(index);
            Val v;
            v.n = constant->GetComponentCount();
            v.offset = offset;
            for (int c = 0; c < v.n; ++c)
                v.id[c] = Checked(builder.Input(static_cast<std::uint32_t>(index), c), offset);
            return v;
        }
        if (name == "pi") return LiteralValue(static_cast<float>(Pi), offset);
        if (name == "tau") return LiteralValue(static_cast<float>(2.0 * Pi), offset);
        if (name == "e") return LiteralValue(2.71828182845904524f, offset);
        if (Functions().count(name))
            throw CompileError("function \"" + name + "\" needs arguments in parentheses", offset);
        throw CompileError("unknown name " + Quote(name), offset);
    }

    Val Call(const std::string& name, std::size_t offset) {
        const auto found = Functions().find(name);
        if (found == Functions().end()) throw CompileError("unknown function " + Quote(name), offset);
        const FunctionInfo& f = found->second;
        Expect(Tok::LParen, "(");
        std::vector<Val> args;
        if (Peek().kind != Tok::RParen) {
            while (true) {
                if (args.size() >= 64) throw CompileError("too many arguments", Peek().offset);
                args.push_back(Ternary());
                if (Peek().kind != Tok::Comma) break;
                Next();
            }
        }
        Expect(Tok::RParen, ")");
        const int count = static_cast<int>(args.size());
        if (f.kind == FunctionInfo::Vector) {
            int total = 0;
            for (const auto& a : args)
                total += a.n;
            if (count == 1 && args[0].n == 1) {
                Val v;
                v.n = f.size;
                v.offset = offset;
                v.dim = args[0].dim;
                for (int c = 0; c < f.size; ++c)
                    v.id[c] = args[0].id[0];
                return v;
            }
            if (total != f.size)
                throw CompileError(name + " takes " + Plural(f.size, "component") + ", got " +
                                       std::to_string(total),
                                   offset);
            Val v;
            v.n = f.size;
            v.offset = offset;
            int k = 0;
            for (const auto& a : args)
                for (int c = 0; c < a.n; ++c)
                    v.id[k++] = a.id[c];
            v.dim = args[0].dim;
            return v;
        }
        if (count < f.minArgs || count > f.maxArgs) {
            const std::string expected =
                f.minArgs == f.maxArgs ? Plural(f.minArgs, "argument")
                                       : std::to_string(f.minArgs) + " or " + Plural(f.maxArgs, "argument");
            throw CompileError(name + " takes " + expected + ", got " + std::to_string(count), offset);
        }
        const float toRadians = static_cast<float>(Pi / 180.0);
        const float toDegrees = static_cast<float>(180.0 / Pi);
        switch (f.kind) {
        case FunctionInfo::Componentwise: {
            Dimension d = Dimension::Plain;
            if (f.op == Op::Abs || f.op == Op::Floor || f.op == Op::Ceil || f.op == Op::Round ||
                f.op == Op::Trunc || f.op == Op::Min || f.op == Op::Max || f.op == Op::Clamp ||
                f.op == Op::Mix || f.op == Op::Mod || f.op == Op::Hypot)
                d = count >= 2 ? Combine(args[0].dim, args[1].dim) : args[0].dim;
            if (count == 1) return Map(f.op, {&args[0]}, offset, d);
            if (count == 2) return Map(f.op, {&args[0], &args[1]}, offset, d);
            return Map(f.op, {&args[0], &args[1], &args[2]}, offset, d);
        }
        case FunctionInfo::Trig: {
            Val a = args[0];
            if (m_Degrees)
                for (int c = 0; c < a.n; ++c)
                    a.id[c] = Multiply(a.id[c], toRadians, offset);
            return Map(f.op, {&a}, offset, Dimension::Plain);
        }
        case FunctionInfo::Atan:
        case FunctionInfo::InverseTrig: {
            Val r = count == 2 ? Map(Op::Atan2, {&args[0], &args[1]}, offset, Dimension::Angle)
                               : Map(f.op, {&args[0]}, offset, Dimension::Angle);
            if (m_Degrees)
                for (int c = 0; c < r.n; ++c)
                    r.id[c] = Multiply(r.id[c], toDegrees, offset);
            return r;
        }
        case FunctionInfo::Rand: {
            Val zero = LiteralValue(0.0f, offset);
            return Map(Op::Rand, {&args[0], count == 2 ? &args[1] : &zero}, offset, Dimension::Plain);
        }
        case FunctionInfo::Fbm: {
            Val octaves = count == 3 ? args[2] : LiteralValue(4.0f, offset);
            return Map(Op::Fbm, {&args[0], &args[1], &octaves}, offset, Dimension::Plain);
        }
        case FunctionInfo::Length:
            return Length(args[0], offset);
        case FunctionInfo::Dot:
            return Dot(args[0], args[1], offset);
        case FunctionInfo::Distance: {
            Val d = Map(Op::Sub, {&args[0], &args[1]}, offset, Combine(args[0].dim, args[1].dim));
            return Length(d, offset);
        }
        case FunctionInfo::Normalize: {
            Val l = Length(args[0], offset);
            return Map(Op::Div, {&args[0], &l}, offset, Dimension::Plain);
        }
        case FunctionInfo::Cross: {
            const Val& a = args[0];
            const Val& b = args[1];
            if (a.n != 3 || b.n != 3) throw CompileError("cross needs two 3-component vectors", offset);
            Val out;
            out.n = 3;
            out.offset = offset;
            const int i1[3] = {1, 2, 0}, i2[3] = {2, 0, 1};
            for (int c = 0; c < 3; ++c) {
                const auto p = Checked(builder.Emit(Op::Mul, a.id[i1[c]], b.id[i2[c]]), offset);
                const auto q = Checked(builder.Emit(Op::Mul, a.id[i2[c]], b.id[i1[c]]), offset);
                out.id[c] = Checked(builder.Emit(Op::Sub, p, q), offset);
            }
            return out;
        }
        default:
            break;
        }
        throw CompileError("unknown function " + Quote(name), offset);
    }

    Val Dot(const Val& a, const Val& b, std::size_t offset) {
        if (a.n != b.n)
            throw CompileError("operands have " + std::to_string(a.n) + " and " + std::to_string(b.n) +
                                   " components",
                               offset);
        std::uint32_t sum = Checked(builder.Emit(Op::Mul, a.id[0], b.id[0]), offset);
        for (int c = 1; c < a.n; ++c)
            sum = Checked(
                builder.Emit(Op::Add, sum, Checked(builder.Emit(Op::Mul, a.id[c], b.id[c]), offset)), offset);
        return Scalar(sum, offset);
    }
    Val Length(const Val& a, std::size_t offset) {
        if (a.n == 1) return Scalar(builder.Emit(Op::Abs, a.id[0]), offset, a.dim);
        Val d = Dot(a, a, offset);
        return Scalar(builder.Emit(Op::Sqrt, d.id[0]), offset, a.dim);
    }

    const std::string& m_Text;
    const Ep::UnitConverter& m_Converter;
    const Ep::Constants& m_Constants;
    bool m_Degrees;
    bool m_IgnoreUnitCase;
    std::array<bool, Ep::UnitCategoryCount> m_Allowed;
    std::vector<Token> m_Tokens;
    std::size_t m_Position = 0;
    int m_Depth = 0;
    std::map<std::string, Val, std::less<>> m_Locals;
};

Ep::Error MakeError(const std::string& text, const std::string& message, std::size_t offset) {
    Ep::Error error;
    offset = std::min(offset, text.size());
    std::size_t lineStart = 0;
    int line = 1;
    for (std::size_t i = 0; i < offset; ++i)
        if (text[i] == '\n') {
            ++line;
            lineStart = i + 1;
        }
    int column = 1;
    for (std::size_t i = lineStart; i < offset; ++i)
        if ((static_cast<unsigned char>(text[i]) & 0xC0) != 0x80) ++column;
    std::size_t lineEnd = text.find('\n', lineStart);
    if (lineEnd == std::string::npos) lineEnd = text.size();
    const bool multiline = text.find('\n') != std::string::npos;
    error.message = message + (multiline ? " at line " + std::to_string(line) + ", column " : " at column ") +
                    std::to_string(column);
    error.line = line;
    error.column = column;
    // A very long line is shown around the column only.
    constexpr std::size_t Shown = 160;
    if (lineEnd - lineStart > Shown && offset - lineStart > Shown / 2) {
        const std::size_t from = offset - Shown / 2;
        error.sourceLine = "..." + text.substr(from, std::min(Shown, lineEnd - from));
        error.column = static_cast<int>(offset - from) + 4;
        for (std::size_t i = from; i < offset; ++i)
            if ((static_cast<unsigned char>(text[i]) & 0xC0) == 0x80) --error.column;
    } else {
        error.sourceLine = text.substr(lineStart, std::min(lineEnd - lineStart, Shown * 2));
    }
    return error;
}

std::shared_ptr<Ep::Program> Finish(const Ep::Program& source, const Ep::ExecuteInfo* info, float scale) {
    auto program = std::make_shared<Ep::Program>();
    program->constants = source.constants;
    program->components = source.components;
    program->dimension = source.dimension;
    program->nodes = source.nodes;
    program->result = source.result;
    (void)info;
    const Rebuilt rebuilt = Refold(source, true, scale);
    Allocate(*program, rebuilt);
    return program;
}

} // namespace

// ---- ParseInfo and ByteCode ------------------------------------------------------------------------------

Ep::ParseInfo::ParseInfo(std::string text, const UnitConverter* converter, Counted<const Constants> constants,
                         bool degrees)
    : m_Text(std::move(text))
    , m_Converter(converter)
    , m_Constants(constants ? std::move(constants) : Counted<const Constants>(new Constants))
    , m_Degrees(degrees) {}

void Ep::ParseInfo::SetUnitCategoryAllowed(int category, bool allowed) noexcept {
    if (category >= 0 && category < UnitCategoryCount) m_AllowedCategories[category] = allowed;
}

Counted<Ep::ByteCode> Ep::ParseInfo::Compile() {
    m_Error = {};
    static const UnitConverter defaultConverter;
    try {
        Parser parser(m_Text, m_Converter ? *m_Converter : defaultConverter, *m_Constants, m_Degrees,
                      m_IgnoreUnitCase, m_AllowedCategories);
        const Val result = parser.Run();
        Program source;
        source.constants = m_Constants;
        source.nodes = std::move(parser.builder.nodes);
        source.components = result.n;
        for (int c = 0; c < result.n; ++c)
            source.result[c] = result.id[c];
        source.dimension = result.dim;
        return Counted<ByteCode>(new ByteCode(Finish(source, nullptr, 1.0f)));
    } catch (const CompileError& e) {
        m_Error = MakeError(m_Text, e.message, e.offset);
    } catch (const std::bad_alloc&) {
        m_Error = MakeError(m_Text, "not enough memory to compile the expression", 0);
    }
    return {};
}

int Ep::ByteCode::GetComponentCount() const noexcept {
    return m_Program->components;
}

std::size_t Ep::ByteCode::GetInstructionCount() const noexcept {
    return m_Program->code.size();
}

bool Ep::ByteCode::IsEmpty() const noexcept {
    return m_Program->components == 0;
}

Counted<Ep::ByteCode> Ep::ByteCode::ConvertToNumeric(const ExecuteInfo& info, int unitType,
                                                     bool acceptPlainNumbers, std::string* error) const {
    auto fail = [error](const char* why) {
        if (error) *error = why;
        return Counted<ByteCode>();
    };
    if (&info.GetConstants() != m_Program->constants.Get())
        return fail("the expression was compiled against another table of constants");
    const Dimension d = m_Program->dimension;
    switch (unitType) {
    case UnitTypeNumber:
        break;
    case UnitTypePixels:
        if (d == Dimension::Angle || (d == Dimension::Plain && !acceptPlainNumbers))
            return fail("the expression does not give a length");
        break;
    case UnitTypeAngle:
        if (d == Dimension::Length || (d == Dimension::Plain && !acceptPlainNumbers))
            return fail("the expression does not give an angle");
        break;
    default:
        return fail("unknown unit type");
    }
    try {
        return Counted<ByteCode>(new ByteCode(Finish(*m_Program, &info, 1.0f)));
    } catch (const std::bad_alloc&) {
        return fail("not enough memory");
    }
}

// ---- Kernel text -----------------------------------------------------------------------------------------

namespace {

// A float literal that reads back to the same bits in both kernel languages.
std::string FloatLiteral(float v) {
    if (!std::isfinite(v)) {
        char buffer[40];
        std::snprintf(buffer, sizeof buffer, "ex_from_bits(0x%08Xu)", std::bit_cast<std::uint32_t>(v));
        return buffer;
    }
    char buffer[40];
    std::snprintf(buffer, sizeof buffer, "%.9g", static_cast<double>(v));
    std::string s = buffer;
    if (s.find_first_of(".e") == std::string::npos) s += ".0";
    s += "f";
    if (s[0] == '-') s = "(" + s + ")";
    return s;
}

constexpr std::string_view ReservedNames[] = {
    // C, C++ and OpenCL C keywords and type names that could collide with a parameter
    "auto",       "bool",        "break",     "case",       "char",      "class",     "const",    "constant",
    "continue",   "default",     "delete",    "do",         "double",    "else",      "enum",     "extern",
    "false",      "float",       "for",       "global",     "goto",      "half",      "if",       "inline",
    "int",        "kernel",      "local",     "long",       "namespace", "new",       "operator", "private",
    "public",     "protected",   "register",  "restrict",   "return",    "short",     "signed",   "sizeof",
    "static",     "struct",      "switch",    "template",   "this",      "true",      "typedef",  "typename",
    "uchar",      "uint",        "ulong",     "union",      "unsigned",  "ushort",    "using",    "virtual",
    "void",       "volatile",    "while",     "and",        "or",        "not",       "xor",      "asm",
    "catch",      "try",         "throw",     "friend",     "mutable",   "explicit",  "export",   "size_t",
    "ptrdiff_t",  "intptr_t",    "uintptr_t", "image2d_t",  "image3d_t", "sampler_t", "event_t",  "read_only",
    "write_only", "Expressions", "Utils",     "NAN",        "INFINITY",  "HUGE_VALF", "MAXFLOAT", "M_PI",
    "M_PI_F",     "__global",    "__local",   "__constant", "__private", "__kernel"};

} // namespace

bool Ep::IsDeviceName(std::string_view name) noexcept {
    if (!Constants::IsIdentifier(name)) return false;
    if (name.substr(0, 3) == "ex_" || name.substr(0, 2) == "__" || name.substr(0, 3) == "rt_") return false;
    for (auto r : ReservedNames)
        if (name == r) return false;
    // Vector type names: vec2 .. vec6 and the built-in vector types of both languages.
    static constexpr std::string_view Scalars[] = {"char", "uchar", "short", "ushort",   "int",
                                                   "uint", "long",  "ulong", "float",    "double",
                                                   "half", "bool",  "vec",   "longlong", "ulonglong"};
    for (auto s : Scalars)
        if (name.size() > s.size() && name.substr(0, s.size()) == s) {
            const auto rest = name.substr(s.size());
            if (rest.find_first_not_of("0123456789") == std::string_view::npos) return false;
        }
    return true;
}

std::string Ep::ByteCode::GetMetalFragment(const ExecuteInfo& info, int unitType) const {
    if (&info.GetConstants() != m_Program->constants.Get()) return {};
    if (unitType != UnitTypeNumber && unitType != UnitTypePixels && unitType != UnitTypeAngle) return {};
    const Program& program = *m_Program;
    try {
        const Rebuilt rebuilt = Refold(program, false, 1.0f);
        const auto& nodes = rebuilt.nodes;
        const auto live = LiveNodes(nodes, rebuilt.result.data(), program.components);
        std::vector<std::string> names(nodes.size());
        std::string text;
        int temporaries = 0;
        for (std::size_t i = 0; i < nodes.size(); ++i) {
            if (!live[i]) continue;
            const Node& n = nodes[i];
            if (n.op == Op::Literal) {
                names[i] = FloatLiteral(n.value);
                continue;
            }
            if (n.op == Op::Input) {
                const auto& constant = program.constants->Get(n.constant);
                if (!IsDeviceName(constant->GetName())) return {};
                names[i] = constant->GetComponentCount() == 1
                               ? constant->GetName()
                               : constant->GetName() + ".v[" + std::to_string(n.component) + "]";
                continue;
            }
            const OpInfo& op = InfoOf(n.op);
            std::string expression;
            if (op.form == Form::Prefix) {
                expression = std::string("(") + op.text + names[n.args[0]] + ")";
            } else if (op.form == Form::Infix) {
                expression = "(" + names[n.args[0]] + " " + op.text + " " + names[n.args[1]] + ")";
            } else {
                expression = std::string(op.text) + "(";
                for (int a = 0; a < op.arity; ++a)
                    expression += (a ? ", " : "") + names[n.args[a]];
                expression += ")";
            }
            names[i] = "ex_t" + std::to_string(temporaries++);
            text += "\tconst float " + names[i] + " = " + expression + ";\n";
        }
        if (program.components == 1) {
            text += "\treturn " + names[rebuilt.result[0]] + ";\n";
        } else {
            text += "\treturn ex_make_vec" + std::to_string(program.components) + "(";
            for (int c = 0; c < program.components; ++c)
                text += (c ? ", " : "") + names[rebuilt.result[c]];
            text += ");\n";
        }
        return text;
    } catch (const std::bad_alloc&) {
        return {};
    }
}

namespace {

std::string VectorTypes(bool cpp) {
    std::string text;
    for (int n = 2; n <= Ep::MaxComponents; ++n) {
        const std::string type = "vec" + std::to_string(n);
        std::string parameters, assignments;
        for (int c = 0; c < n; ++c) {
            parameters += std::string(c ? ", " : "") + "float a" + std::to_string(c);
            assignments += " r.v[" + std::to_string(c) + "] = a" + std::to_string(c) + ";";
        }
        if (cpp) {
            std::string members;
            for (int c = 0; c < n; ++c)
                members += " v[" + std::to_string(c) + "] = a" + std::to_string(c) + ";";
            text += "struct " + type + " {\n\tfloat v[" + std::to_string(n) + "];\n\t" + type + "() {}\n\t" +
                    type + "(" + parameters + ") {" + members + " }\n" +
                    "\tfloat& operator[](int i) { return v[i]; }\n" +
                    "\tfloat operator[](int i) const { return v[i]; }\n};\n";
            text += "inline " + type + " ex_make_" + type + "(" + parameters + ") { " + type + " r;" +
                    assignments + " return r; }\n";
        } else {
            text += "typedef struct { float v[" + std::to_string(n) + "]; } " + type + ";\n";
            text += "inline " + type + " ex_make_" + type + "(" + parameters + ") { " + type + " r;" +
                    assignments + " return r; }\n";
        }
    }
    return text;
}

#define EXPRESSION_STRINGIFY_TOKENS(...) #__VA_ARGS__
#define EXPRESSION_STRINGIFY(...) EXPRESSION_STRINGIFY_TOKENS(__VA_ARGS__)

std::string BuildPrelude(int language) {
    std::string text = "#ifndef KERNEL_EXPRESSIONS\n#define KERNEL_EXPRESSIONS\n";
    if (language == 0) {
        text += "namespace Expressions {\n"
                "#define ex_inline inline\n"
                "typedef unsigned int ex_uint;\n"
                "inline ex_uint ex_bits(float v) { return __float_as_uint(v); }\n"
                "inline float ex_from_bits(ex_uint v) { return __uint_as_float(v); }\n"
                "inline float ex_floor_p(float v) { return floorf(v); }\n"
                "inline float ex_sqrt_p(float v) { return sqrtf(v); }\n";
    } else {
        text += "#define ex_inline inline\n"
                "typedef uint ex_uint;\n"
                "inline ex_uint ex_bits(float v) { return as_uint(v); }\n"
                "inline float ex_from_bits(ex_uint v) { return as_float(v); }\n"
                "inline float ex_floor_p(float v) { return floor(v); }\n"
                "inline float ex_sqrt_p(float v) { return sqrt(v); }\n";
    }
    text += EXPRESSION_STRINGIFY(KERNEL_EXPRESSION_MATH_SOURCE);
    text += "\n";
    text += VectorTypes(language == 0);
    if (language == 0) text += "} // namespace Expressions\n";
    text += "#endif\n";
    return text;
}

} // namespace

const char* Ep::GetDevicePrelude(int language) noexcept {
    static const std::string texts[2] = {BuildPrelude(0), BuildPrelude(1)};
    if (language != 0 && language != 1) return nullptr;
    return texts[language].c_str();
}

namespace {

// One instruction over n lanes, one function per operation so that each is inlined and vectorised on its
// own. The destination may be one of the arguments: each lane is read before it is written.
using SpanFunction = void (*)(float* dest, const float* A, const float* B, const float* C, int count);

// Each operation is built for any x86-64 and, where the compiler can, for AVX2 (Kernel::HasAvx2 picks when a
// session is made, so RASTERTOOLS_NO_SIMD turns it off). AVX2 brings no fused multiply-add, so both builds
// round as the kernel text does.
#if RT_AVX2_BUILD && !defined(__SANITIZE_ADDRESS__)
#define EXPRESSION_HAS_AVX2 1
#define EXPRESSION_AVX2_BUILD(name)                                                                          \
    template <int Fixed>                                                                                     \
    RT_TARGET_AVX2 __attribute__((flatten)) void name##Avx2(float* dest, const float* A, const float* B,     \
                                                            const float* C, int count) {                     \
        name##Body<Fixed>(dest, A, B, C, count);                                                             \
    }
#else
#define EXPRESSION_HAS_AVX2 0
#define EXPRESSION_AVX2_BUILD(name)
#endif

#define EXPRESSION_BUILDS(name)                                                                              \
    template <int Fixed>                                                                                     \
    void name(float* dest, const float* A, const float* B, const float* C, int count) {                      \
        name##Body<Fixed>(dest, A, B, C, count);                                                             \
    }                                                                                                        \
    EXPRESSION_AVX2_BUILD(name)

#define EXPRESSION_SPAN(name, arity, form, text, expr)                                                       \
    template <int Fixed>                                                                                     \
    inline __attribute__((always_inline)) void Span##name##Body(float* dest, const float* A, const float* B, \
                                                                const float* C, int count) {                 \
        const int n = Fixed > 0 ? Fixed : count;                                                             \
        _Pragma("omp simd") for (int i = 0; i < n; ++i) {                                                    \
            const float a = A[i];                                                                            \
            [[maybe_unused]] const float b = B[i];                                                           \
            [[maybe_unused]] const float c = C[i];                                                           \
            dest[i] = expr;                                                                                  \
        }                                                                                                    \
    }                                                                                                        \
    EXPRESSION_BUILDS(Span##name)
EXPRESSION_OPERATIONS(EXPRESSION_SPAN)
#undef EXPRESSION_SPAN

// Fractal noise octave by octave across the lanes, so that each octave's noise vectorises; every lane adds
// the same terms in the same order as ex_fbm, so the values are its values.
template <int Fixed>
inline __attribute__((always_inline)) void SpanFbmByOctaveBody(float* dest, const float* A, const float* B,
                                                               const float* C, int count) {
    const int n = Fixed > 0 ? Fixed : count;
    alignas(64) float sum[Ep::Lanes];
    alignas(64) float total[Ep::Lanes];
    alignas(64) int octaves[Ep::Lanes];
    int most = 1;
    for (int i = 0; i < n; ++i) {
        octaves[i] = ex_to_int(ex_clamp(ex_floor_p(C[i]), 1.0f, 12.0f));
        most = std::max(most, octaves[i]);
        sum[i] = 0.0f;
        total[i] = 0.0f;
    }
    float weight = 1.0f, scale = 1.0f;
    for (int k = 0; k < most; ++k) {
        const float shift = static_cast<float>(k) * 17.31f;
#pragma omp simd
        for (int i = 0; i < n; ++i) {
            const float term = weight * ex_noise(A[i] * scale + shift, B[i] * scale - shift);
            const bool on = k < octaves[i];
            sum[i] = on ? sum[i] + term : sum[i];
            total[i] = on ? total[i] + weight : total[i];
        }
        weight = weight * 0.5f;
        scale = scale * 2.0f;
    }
    for (int i = 0; i < n; ++i)
        dest[i] = sum[i] / total[i];
}

EXPRESSION_BUILDS(SpanFbmByOctave)

// The functions for a whole span and for fewer lanes, in the AVX2 build when avx2 is true.
std::pair<SpanFunction, SpanFunction> SpanFunctionsOf(Op op, bool avx2) {
#if EXPRESSION_HAS_AVX2
#define EXPRESSION_PICK(name)                                                                                \
    return avx2 ? std::pair<SpanFunction, SpanFunction>{&name##Avx2<Ep::Lanes>, &name##Avx2<0>}              \
                : std::pair<SpanFunction, SpanFunction> {                                                    \
        &name<Ep::Lanes>, &name<0>                                                                           \
    }
#else
#define EXPRESSION_PICK(name)                                                                                \
    (void)avx2;                                                                                              \
    return std::pair<SpanFunction, SpanFunction> {                                                           \
        &name<Ep::Lanes>, &name<0>                                                                           \
    }
#endif
    if (op == Op::Fbm) {
        EXPRESSION_PICK(SpanFbmByOctave);
    }
    switch (op) {
#define EXPRESSION_SPAN_CASE(name, arity, form, text, expr)                                                  \
    case Op::name: {                                                                                         \
        EXPRESSION_PICK(Span##name);                                                                         \
    }
        EXPRESSION_OPERATIONS(EXPRESSION_SPAN_CASE)
#undef EXPRESSION_SPAN_CASE
#undef EXPRESSION_PICK
    default:
        break;
    }
    return {nullptr, nullptr};
}

} // namespace

// ---- Sessions --------------------------------------------------------------------------------------------

struct Ep::ByteCode::Session::State {
    Counted<const ByteCode> byteCode;
    Counted<const ExecuteInfo> info;
    std::vector<Counted<Constant>> inputs; // keeps the constants whose lanes are read alive
    std::vector<float> storage;            // registers, literal lanes, zeros; 64-byte aligned within
    struct Bound {
        void (*whole)(float*, const float*, const float*, const float*, int);
        void (*part)(float*, const float*, const float*, const float*, int);
        float* dest;
        const float* args[3];
    };
    std::vector<Bound> code;
    std::array<const float*, MaxComponents> outputs{};
    std::array<float, MaxComponents * Lanes> constantResult{};
};

Ep::ByteCode::Session::Session(std::unique_ptr<State> state)
    : m_State(std::move(state)) {}

Ep::ByteCode::Session::~Session() = default;

std::unique_ptr<Ep::ByteCode::Session>
Ep::ByteCode::Session::CreateForThread(Counted<const ByteCode> byteCode, Counted<const ExecuteInfo> info) {
    if (!byteCode || !info) return nullptr;
    const Program& program = byteCode->GetProgram();
    if (&info->GetConstants() != program.constants.Get()) return nullptr;
    auto state = std::make_unique<State>();
    state->byteCode = byteCode;
    state->info = info;
    for (const auto& slot : program.inputs) {
        auto constant = info->GetThreadConstant(*program.constants->Get(slot.constant));
        if (!constant) return nullptr;
        state->inputs.push_back(std::move(constant));
    }
    const std::size_t slots = program.registers + program.literals.size() + 1;
    state->storage.assign(slots * Lanes + 16, 0.0f);
    float* base = state->storage.data();
    while (reinterpret_cast<std::uintptr_t>(base) % 64 != 0)
        ++base;
    float* registers = base;
    float* literals = base + std::size_t(program.registers) * Lanes;
    float* zeros = literals + program.literals.size() * Lanes;
    for (std::size_t l = 0; l < program.literals.size(); ++l)
        std::fill_n(literals + l * Lanes, Lanes, program.literals[l]);
    auto resolve = [&](const Operand& o) -> const float* {
        switch (o.kind) {
        case OperandKind::Register:
            return registers + std::size_t(o.index) * Lanes;
        case OperandKind::Literal:
            return literals + std::size_t(o.index) * Lanes;
        case OperandKind::Input: {
            const auto& slot = program.inputs[o.index];
            return state->inputs[o.index]->GetLanes(slot.component);
        }
        case OperandKind::Zero:
            break;
        }
        return zeros;
    };
    const bool avx2 = Kernel::HasAvx2();
    for (const auto& in : program.code) {
        const auto functions = SpanFunctionsOf(in.op, avx2);
        if (!functions.first) return nullptr;
        state->code.push_back({functions.first,
                               functions.second,
                               registers + std::size_t(in.dest) * Lanes,
                               {resolve(in.args[0]), resolve(in.args[1]), resolve(in.args[2])}});
    }
    for (int c = 0; c < program.components; ++c)
        state->outputs[c] = resolve(program.outputs[c]);
    return std::unique_ptr<Session>(new Session(std::move(state)));
}

bool Ep::ByteCode::Session::ExecuteSpan(int count) noexcept {
    if (!m_State || count < 1 || count > Lanes) return false;
    if (count == Lanes)
        for (const auto& in : m_State->code)
            in.whole(in.dest, in.args[0], in.args[1], in.args[2], count);
    else
        for (const auto& in : m_State->code)
            in.part(in.dest, in.args[0], in.args[1], in.args[2], count);
    return true;
}

bool Ep::ByteCode::Session::Execute(Value& result) noexcept {
    if (!ExecuteSpan(1)) return false;
    const int n = GetComponentCount();
    result.components = n;
    for (int c = 0; c < n; ++c)
        result.values[c] = m_State->outputs[c][0];
    return true;
}

const float* Ep::ByteCode::Session::GetResultLanes(int component) const noexcept {
    if (!m_State || component < 0 || component >= GetComponentCount()) return nullptr;
    return m_State->outputs[component];
}

int Ep::ByteCode::Session::GetComponentCount() const noexcept {
    return m_State ? m_State->byteCode->GetComponentCount() : 0;
}

} // namespace Kernel
