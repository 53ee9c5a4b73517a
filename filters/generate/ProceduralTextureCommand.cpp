// The procedural texture command: binding and compiling the equations, evaluating them per thread on the
// processor, generating and caching the device's Sample text per config, and the command's saved form.
#include "filters/generate/ProceduralTextureCommand.h"

#include "frame/Registration.h"
#include "host/kernel/CriticalSectionSpin.h"
#include "host/kernel/Reflection.h"
#include "host/raster/KernelText.h"
#include "host/raster/device/Hardware.h"

#include <cctype>
#include <cmath>
#include <fstream>
#include <map>
#include <tuple>

namespace RasterTools {

// The filter enters the catalogue and the host's class list when the library loads.
[[maybe_unused]] const FilterRegistration<ProceduralTextureFilter> kProceduralTextureRegistration;

using Parser = Kernel::ExpressionParser;
using Kernel::Counted;
using Config = ProceduralTextureConfig;

std::string ProceduralTextureMath::GetProceduralTextureMathText() {
    return std::string("#ifndef RT_PROCEDURAL_TEXTURE_MATH\n#define RT_PROCEDURAL_TEXTURE_MATH\n") +
           RASTER_KERNEL_STRINGIFY(RT_PROCEDURAL_TEXTURE_SOURCE) + "\n#endif\n";
}

// ---- Evaluation on the processor

ProceduralTextureEvaluator::ProceduralTextureEvaluator(const ProceduralTextureState& state,
                                                       const float* block)
    : m_State(state) {
    if (!state.executeInfo) return;
    m_Info = state.executeInfo->CopyForThreadSession();
    const auto own = [&](const Counted<Parser::Constant>& constant) {
        return constant ? m_Info->GetThreadConstant(*constant) : Counted<Parser::Constant>();
    };
    m_X = own(state.x);
    m_Y = own(state.y);
    m_RX = own(state.rx);
    m_RY = own(state.ry);
    // The render's own origin and size, as the floats the device reads.
    const std::pair<Counted<Parser::Constant>, float> fixed[] = {{own(state.ox), block[6]},
                                                                 {own(state.oy), block[7]},
                                                                 {own(state.w), block[8]},
                                                                 {own(state.h), block[9]}};
    for (const auto& [constant, value] : fixed)
        if (constant) std::fill_n(constant->GetLanes(), Lanes, value);
    for (const auto& channel : state.channels)
        m_Channels.push_back(own(channel));
    for (const auto& equation : state.equations)
        m_Sessions.push_back(Parser::ByteCode::Session::CreateForThread(equation.byteCode, m_Info));
}

unsigned ProceduralTextureEvaluator::Evaluate(int x0, int y, int n, const float* block,
                                              const float (*source)[Lanes], float (*result)[Lanes]) {
    if (!m_X || !m_Y || !m_RX || !m_RY || n < 1 || n > Lanes) return 0;
    float* xs = m_X->GetLanes();
    float* ys = m_Y->GetLanes();
    float* rxs = m_RX->GetLanes();
    float* rys = m_RY->GetLanes();
    // The pixel centre through the sampler affine, with the kernel's float arithmetic in the kernel's order.
    const float py = float(y) + 0.5f;
    for (int i = 0; i < n; ++i) {
        const float px = float(x0 + i) + 0.5f;
        const float sx = (px * block[0]) + (py * block[1]) + block[2];
        const float sy = (px * block[3]) + (py * block[4]) + block[5];
        xs[i] = sx;
        ys[i] = sy;
        rxs[i] = sx - block[6];
        rys[i] = sy - block[7];
    }
    const int channels = int(m_Channels.size());
    for (int c = 0; c < channels; ++c)
        if (m_Channels[std::size_t(c)]) std::copy_n(source[c], n, m_Channels[std::size_t(c)]->GetLanes());

    unsigned written = 0;
    for (std::size_t e = 0; e < m_Sessions.size(); ++e) {
        auto& session = m_Sessions[e];
        // A failed evaluation leaves this equation's channels as they were.
        if (!session || !session->ExecuteSpan(n)) continue;
        const int components = session->GetComponentCount();
        const std::uint32_t mask = m_State.equations[e].mask;
        int k = 0;
        for (int c = 0; c < channels; ++c) {
            if (!(mask & (1u << c))) continue;
            const float* lanes = components < 2   ? session->GetResultLanes(0)
                                 : k < components ? session->GetResultLanes(k)
                                                  : nullptr;
            if (lanes)
                std::copy_n(lanes, n, result[c]);
            else
                std::fill_n(result[c], n, 0.0f);
            written |= 1u << c;
            ++k;
        }
    }
    return written;
}

// ---- Binding and compiling

namespace {

std::uint32_t AllowedMask(Config::ColourFormat format) {
    switch (format) {
    case Config::RGB:
    case Config::Lab:
        return 15;
    case Config::CMYK:
        return 31;
    case Config::Intensity:
        return 3;
    case Config::Alpha:
        return 1;
    }
    return 0;
}

// The raster format a config of each colour format is checked against.
Raster::PixelFormat RepresentativeFormat(Config::ColourFormat format) {
    switch (format) {
    case Config::CMYK:
        return Raster::PixelFormat::CMYKA8;
    case Config::Lab:
        return Raster::PixelFormat::LabA16;
    case Config::Intensity:
        return Raster::PixelFormat::IA8;
    case Config::Alpha:
        return Raster::PixelFormat::MaskA8;
    default:
        return Raster::PixelFormat::RGBA8;
    }
}

// An input's bound value: its value when one is given (an integer as a double, a vector's angles as the unit
// vector), else 1 for a real, 0 for the other numbers and (1, 0, 0) for a vector.
std::array<double, 3> InputValue(const ExpressionConstant& constant, const ExpressionConstantValues* values,
                                 std::size_t index) {
    const ExpressionConstantValue* value =
        values && index < values->GetCount() ? &values->Get(index) : nullptr;
    if (constant.IsVector()) {
        const auto* angles = value ? std::get_if<ExpressionConstantValueVec>(value) : nullptr;
        return ExpressionConstantValues::ToUnitVector(angles ? *angles : ExpressionConstantValueVec{});
    }
    if (value && !std::holds_alternative<ExpressionConstantValueVec>(*value))
        return {ExpressionConstantValues::ToDouble(*value), 0.0, 0.0};
    return {constant.GetKind() == ExpressionConstant::Real ? 1.0 : 0.0, 0.0, 0.0};
}

std::string Quote(const std::string& text) {
    constexpr std::size_t Limit = 40;
    return "\"" + (text.size() > Limit ? text.substr(0, Limit) + "..." : text) + "\"";
}

} // namespace

bool ProceduralTextureCommand::Init(Raster::PixelFormat format, Kernel::PointT<double> documentSize,
                                    double pixelsPerInch, Kernel::PointT<double> origin,
                                    const Config::Handle& config,
                                    const Counted<const ExpressionConstantValues>& values, State& state) {
    state = State{};
    if (!config) {
        state.error = "no config";
        return false;
    }
    const Config::ColourFormat colour = config->GetColourFormat();
    state.colourFormat = colour;
    const auto rasterColour = Config::ColourFormatFromRasterFormat(format);
    if (rasterColour && *rasterColour != colour) {
        state.error = std::string("a ") + Config::ColourFormatString(colour) + " texture cannot paint a " +
                      Config::ColourFormatString(*rasterColour) + " layer";
        return false;
    }
    const std::uint32_t allowed = rasterColour ? AllowedMask(colour) : 0;

    state.constants = Counted<Parser::Constants>(new Parser::Constants);
    Parser::Constants& table = *state.constants;
    state.ox = table.AddVolatile("ox", origin.x);
    state.oy = table.AddVolatile("oy", origin.y);
    state.w = table.AddVolatile("w", documentSize.x);
    state.h = table.AddVolatile("h", documentSize.y);
    // Inputs are volatile too, so that compiled equations never fold a value in: the device's text is kept
    // per config and reads the values from the sampler block.
    const ExpressionConstantSet& set = config->GetConstantSet();
    for (std::size_t i = 0; i < set.GetCount(); ++i) {
        const ExpressionConstant& input = set.Get(i);
        const auto value = InputValue(input, values.Get(), i);
        Counted<Parser::Constant> bound = input.IsVector() ? table.AddVector(input.GetConstant(), value, true)
                                                           : table.AddVolatile(input.GetConstant(), value[0]);
        if (!bound) {
            state.error = "input " + Quote(input.GetConstant()) + " is not a name or is taken";
            return false;
        }
        state.inputs.push_back(std::move(bound));
    }
    state.x = table.AddVolatile("x", 0.0);
    state.y = table.AddVolatile("y", 0.0);
    state.rx = table.AddVolatile("rx", 0.0);
    state.ry = table.AddVolatile("ry", 0.0);
    if (!state.x || !state.y || !state.rx || !state.ry) {
        state.error = "an input takes the name of a pixel variable (x, y, rx, ry)";
        return false;
    }
    for (const std::string& name : Config::ChannelNames(colour)) {
        auto channel = table.AddVolatile(name, 0.0);
        if (!channel) {
            state.error = "an input takes the name of the channel " + Quote(name);
            return false;
        }
        state.channels.push_back(std::move(channel));
    }
    state.executeInfo = Parser::ExecuteInfo::Create(state.constants);
    state.converter = std::make_shared<Parser::UnitConverter>(pixelsPerInch > 0.0 ? pixelsPerInch : 72.0);

    std::uint32_t claimed = 0;
    const auto& equations = config->GetEquations();
    for (std::size_t e = 0; e < equations.size(); ++e) {
        const auto& equation = equations[e];
        if (!equation || equation->GetText().empty()) continue;
        const std::uint32_t mask = (equation->GetChannelMask() & allowed) & ~claimed;
        if (!mask) continue;
        claimed |= mask;
        auto parse = std::make_shared<Parser::ParseInfo>(equation->GetText(), state.converter.get(),
                                                         state.constants, !config->GetAnglesInRadians());
        parse->SetUnitCategoryAllowed(4, false);
        parse->SetIgnoreUnitTypeCase(false);
        const auto where = "equation " + std::to_string(e + 1) + " " + Quote(equation->GetText()) + ": ";
        const Counted<Parser::ByteCode> compiled = parse->Compile();
        if (!compiled) {
            state.error = where + parse->GetError().message;
            return false;
        }
        std::string why;
        Counted<Parser::ByteCode> numeric = compiled->ConvertToNumeric(*state.executeInfo, 5, true, &why);
        if (!numeric) {
            state.error = where + (why.empty() ? std::string("the result is not a number") : why);
            return false;
        }
        state.equations.push_back({std::move(parse), std::move(numeric), mask, int(e)});
    }
    return true;
}

bool ProceduralTextureCommand::ValidateConfig(const Config::Handle& config,
                                              const Counted<const ExpressionConstantValues>& values,
                                              std::string* error) {
    if (!config || config->GetEquationCount() == 0) {
        if (error) *error = "the texture has no equations";
        return false;
    }
    State state;
    const bool valid = Init(RepresentativeFormat(config->GetColourFormat()), {1.0, 1.0}, 72.0, {0.0, 0.0},
                            config, values, state);
    if (!valid && error) *error = state.error;
    return valid;
}

// ---- The short form of equations

std::optional<ProceduralTextureEquation> ProceduralTextureCommand::ParseEquation(Config::ColourFormat format,
                                                                                 std::string_view text,
                                                                                 std::string* error) {
    const auto equals = text.find('=');
    if (equals == std::string_view::npos) {
        if (error) *error = "expected CHANNELS=EXPRESSION, e.g. rgb=x/w";
        return std::nullopt;
    }
    const auto mask = Config::ParseChannels(format, text.substr(0, equals), error);
    if (!mask) return std::nullopt;
    return ProceduralTextureEquation(std::string(text.substr(equals + 1)), *mask);
}

std::string ProceduralTextureCommand::FormatEquation(Config::ColourFormat format,
                                                     const ProceduralTextureEquation& equation) {
    return Config::FormatChannels(format, equation.GetChannelMask()) + "=" + equation.GetText();
}

namespace {
// A blend mode's name on the command line: the host's name in lower case, spaces as hyphens.
std::string BlendModeFlagName(int mode) {
    std::string name = Kernel::ReflectedBlendMode::GetBlendModeNames()[std::size_t(mode)].GetEnglish();
    for (char& c : name)
        c = c == ' ' ? '-' : char(std::tolower(static_cast<unsigned char>(c)));
    return name;
}

std::string BlendModeList() {
    std::string list;
    for (int mode = 0; mode < ProceduralTextureCommand::BlendModeCount; ++mode)
        list += (mode ? ", " : "") + BlendModeFlagName(mode);
    return list;
}
} // namespace

std::optional<ProceduralTextureCommand::BlendModeType>
ProceduralTextureCommand::ParseBlendMode(std::string_view text) {
    std::string wanted(text);
    for (char& c : wanted)
        c = c == ' ' || c == '_' ? '-' : char(std::tolower(static_cast<unsigned char>(c)));
    for (int mode = 0; mode < BlendModeCount; ++mode) {
        const std::string name = BlendModeFlagName(mode);
        std::string american = name;
        if (const auto at = american.find("colour"); at != std::string::npos) american.erase(at + 4, 1);
        if (wanted == name || wanted == american) return mode;
    }
    return std::nullopt;
}

Counted<RasterCommand>
ProceduralTextureCommand::MakeCommandWithText(bool liveEffect, const std::vector<ParameterValue>& values,
                                              const std::vector<std::pair<std::string, std::string>>& texts,
                                              std::string& error) {
    ProceduralTextureParameters params = DefaultParameters(ProceduralTextureFilter::kParameters);
    for (std::size_t i = 0; i < values.size() && i < ProceduralTextureFilter::kParameters.size(); ++i)
        SetParameter(params, ProceduralTextureFilter::kParameters[i], values[i]);
    BoundParameters(params, ProceduralTextureFilter::kParameters);
    const auto& preset =
        GetStarterPresets()[std::size_t(std::clamp(params.preset, 0, int(GetStarterPresets().size()) - 1))];
    Config::Handle config = preset.GetConfig();
    Counted<const ExpressionConstantValues> inputValues = preset.GetValues();

    std::optional<Config::ColourFormat> colour;
    std::optional<bool> radians;
    std::vector<std::string> equations, assignments;
    bool fromFile = false;
    BlendModeType blendMode = 0;
    for (const auto& [flag, text] : texts) {
        if (flag == "blend") {
            const auto mode = ParseBlendMode(text);
            if (!mode) {
                error = "--blend: \"" + text + "\" is not a blend mode (" + BlendModeList() + ")";
                return nullptr;
            }
            blendMode = *mode;
        } else if (flag == "config") {
            if (fromFile) {
                error = "--config is given more than once";
                return nullptr;
            }
            std::ifstream file(text, std::ios::binary);
            if (!file) {
                error = text + ": cannot be read";
                return nullptr;
            }
            std::string contents;
            constexpr std::size_t Limit = 4 << 20; // a texture is a few lines; anything larger is not one
            contents.resize(Limit + 1);
            file.read(contents.data(), std::streamsize(contents.size()));
            contents.resize(std::size_t(file.gcount()));
            if (contents.size() > Limit) {
                error = text + ": larger than a texture definition can be";
                return nullptr;
            }
            std::string why;
            const auto definition = ReadProceduralTextureJson(contents, why);
            if (!definition) {
                error = text + ": " + why;
                return nullptr;
            }
            config = definition->config;
            inputValues = definition->values;
            fromFile = true;
        } else if (flag == "eq") {
            equations.push_back(text);
        } else if (flag == "input") {
            assignments.push_back(text);
        } else if (flag == "colour") {
            colour = Config::ParseColourFormat(text);
            if (!colour) {
                error = "--colour: \"" + text + "\" is not RGB, CMYK, Lab, Intensity or Alpha";
                return nullptr;
            }
        } else if (flag == "angles") {
            if (text != "deg" && text != "rad") {
                error = "--angles: expected deg or rad";
                return nullptr;
            }
            radians = text == "rad";
        } else {
            error = "--" + flag + " is not a flag of proceduraltexture";
            return nullptr;
        }
    }
    if (!equations.empty()) {
        if (fromFile) {
            error = "--eq and --config cannot be used together";
            return nullptr;
        }
        config = Config::CreateEmpty(colour.value_or(Config::RGB));
        inputValues = Counted<const ExpressionConstantValues>(new ExpressionConstantValues);
        for (const std::string& text : equations) {
            std::string why;
            const auto equation = ParseEquation(config->GetColourFormat(), text, &why);
            if (!equation) {
                error = "--eq \"" + text + "\": " + why;
                return nullptr;
            }
            config = config->AddEquation(*equation);
        }
        if (!radians) radians = false;
    } else if (colour && *colour != config->GetColourFormat()) {
        error = "--colour needs --eq (a preset or config keeps its own colour format)";
        return nullptr;
    }
    if (radians) config = config->ChangeAnglesInRadians(*radians);
    // --input sets an input's value, adding a real input of that name when there is none.
    auto valuesCopy =
        inputValues ? inputValues->Clone() : ExpressionConstantValues::Create(config->GetConstantSet());
    for (const std::string& assignment : assignments) {
        const auto equals = assignment.find('=');
        const auto number = equals == std::string::npos
                                ? std::nullopt
                                : ParseParameterValue(ParameterType::Double, assignment.substr(equals + 1));
        if (!number) {
            error = "--input \"" + assignment + "\": expected NAME=NUMBER";
            return nullptr;
        }
        const std::string name = assignment.substr(0, equals);
        const double value = std::get<double>(*number);
        const int index = config->GetConstantSet().IndexOf(name);
        if (index < 0) {
            auto input = ExpressionConstant::Create(ExpressionConstant::Real, name, "", std::min(0.0, value),
                                                    std::max(1.0, value));
            config = config->ReplaceConstantSet(config->GetConstantSet().WithAdded(input));
            auto grown = valuesCopy->GetValues();
            grown.emplace_back(value);
            valuesCopy = Kernel::MakeCounted<ExpressionConstantValues>(std::move(grown));
        } else if (config->GetConstantSet().Get(std::size_t(index)).IsVector()) {
            error = "--input " + name + ": a vector input is set in a --config file";
            return nullptr;
        } else {
            while (valuesCopy->GetCount() <= std::size_t(index)) {
                auto grown = valuesCopy->GetValues();
                grown.emplace_back(0.0);
                valuesCopy = Kernel::MakeCounted<ExpressionConstantValues>(std::move(grown));
            }
            if (config->GetConstantSet().Get(std::size_t(index)).GetKind() == ExpressionConstant::Integer)
                valuesCopy->Set(std::size_t(index), int(std::lround(value)));
            else
                valuesCopy->Set(std::size_t(index), value);
        }
    }
    if (!ValidateConfig(config, valuesCopy, &error)) return nullptr;
    return Counted<RasterCommand>(new ProceduralTextureCommand(liveEffect, params.origin, params.opacity,
                                                               blendMode, config, valuesCopy));
}

// ---- The device's Sample text

namespace {

struct FormatAccess {
    std::vector<const char*> components; // the stored pixel's channels in mask order
    const char* stored = nullptr;        // a component's type; null for float
    const char* maximum = nullptr;       // as a float literal
};

std::optional<FormatAccess> DescribeFormat(Raster::PixelFormat format) {
    using Raster::PixelFormat;
    switch (format) {
    case PixelFormat::RGBA8:
        return FormatAccess{{"x", "y", "z", "w"}, "uchar", "255.0f"};
    case PixelFormat::RGBA16:
    case PixelFormat::LabA16:
        return FormatAccess{{"x", "y", "z", "w"}, "ushort", "65535.0f"};
    case PixelFormat::RGBAUF:
        return FormatAccess{{"x", "y", "z", "w"}, nullptr, "1.0f"};
    case PixelFormat::IA8:
        return FormatAccess{{"x", "y"}, "uchar", "255.0f"};
    case PixelFormat::IA16:
        return FormatAccess{{"x", "y"}, "ushort", "65535.0f"};
    case PixelFormat::CMYKA8:
        return FormatAccess{{"cmyk[0]", "cmyk[1]", "cmyk[2]", "cmyk[3]", "a"}, "uchar", "255.0f"};
    default:
        return std::nullopt;
    }
}

// The Sample body: the pixel centre in texture space and the variables every equation reads (%1 the inputs'
// declarations), the source pixel's channels (%2), the calls that store the results (%3), the blend and the
// opacity (%6) and the stores into the returned pixel (%4).
//
// The texture's stages are the identity transform and the zero extend, so the source pixel is the one at
// the pixel's own location (the identity takes the centre x + 0.5 to x), or zero outside the source. It is
// read from clamped coordinates and then selected, without a branch around the load, so that compilers
// that run work items as loops can keep them free of control flow.
constexpr const char* SampleBody = R"(const float olx = (float)location.x + 0.5f;
const float oly = (float)location.y + 0.5f;
const float sx = (olx * sampler_params[0]) + (oly * sampler_params[1]) + sampler_params[2];
const float sy = (olx * sampler_params[3]) + (oly * sampler_params[4]) + sampler_params[5];
const float ox = sampler_params[6];
const float oy = sampler_params[7];
const float w = sampler_params[8];
const float h = sampler_params[9];
const float rx = sx - ox;
const float ry = sy - oy;
const float opacity = sampler_params[%5];
%1
const int inside = location.x >= 0 && location.y >= 0 && location.x < (int)source_bounds.x && location.y < (int)source_bounds.y;
const source_type loaded = LoadSource(input_pixels, source_bounds, make_int2(rt_clampi(location.x, 0, (int)source_bounds.x - 1), rt_clampi(location.y, 0, (int)source_bounds.y - 1)));
const source_type pixel = inside ? loaded : source_minimum();
%2
%3
%6
source_type result = pixel;
%4
(void)transform_params;
(void)source_params;
(void)sampler_bounds;
(void)sampler_pixels;
return result;)";

std::string BuildSampleText(const Config& config, const ProceduralTextureState& state,
                            Raster::PixelFormat format, HardwareKernelLanguage language, bool blended) {
    const auto access = DescribeFormat(format);
    if (!access) return {};
    const bool cpp = language == HardwareKernelLanguage::CudaCpp;
    const char* prelude = Parser::GetDevicePrelude(cpp ? 0 : 1);
    if (!prelude || (!cpp && language != HardwareKernelLanguage::OpenCLC)) return {};

    const auto& names = Config::ChannelNames(config.GetColourFormat());
    const int channels = int(names.size());
    if (channels != int(access->components.size())) return {};

    // Parameters and call arguments of every equation's function.
    std::string parameters = "float x, float y, float rx, float ry, float ox, float oy, float w, float h";
    std::string arguments = "sx,sy,rx,ry,ox,oy,w,h";
    for (int c = 0; c < channels; ++c) {
        parameters += ", float " + names[std::size_t(c)];
        arguments += ",ch" + std::to_string(c);
    }
    std::string declarations;
    int slot = ProceduralTextureMath::FirstInputSlot;
    const ExpressionConstantSet& set = config.GetConstantSet();
    for (std::size_t i = 0; i < set.GetCount(); ++i) {
        const ExpressionConstant& input = set.Get(i);
        const std::string& name = input.GetConstant();
        if (!Parser::IsDeviceName(name)) return {};
        if (input.IsVector()) {
            if (slot + 3 > ProceduralTextureMath::FirstInputSlot + ProceduralTextureMath::InputSlots)
                return {};
            declarations += Raster::FormatKernelText(
                "const vec3 user_%1 = "
                "ex_make_vec3(sampler_params[%2],sampler_params[%3],sampler_params[%4]);\n",
                {name, std::to_string(slot), std::to_string(slot + 1), std::to_string(slot + 2)});
            parameters += ", vec3 " + name;
            slot += 3;
        } else {
            if (slot + 1 > ProceduralTextureMath::FirstInputSlot + ProceduralTextureMath::InputSlots)
                return {};
            declarations += "const float user_" + name + " = sampler_params[" + std::to_string(slot) + "];\n";
            parameters += ", float " + name;
            slot += 1;
        }
        arguments += ",user_" + name;
    }

    std::string reads;
    for (int c = 0; c < channels; ++c) {
        const std::string n = std::to_string(c);
        reads += "const float raw" + n + " = (float)pixel." + access->components[std::size_t(c)] + ";\n";
        reads += "const float ch" + n + " = raw" + n + " / " + access->maximum + ";\n";
        reads += "float out" + n + " = raw" + n + ";\n";
    }
    // The texture's values, which the equations' calls fill in.
    for (int c = 0; c < channels; ++c) {
        const std::string n = std::to_string(c);
        reads += "float tex" + n + " = ch" + n + ";\n";
    }
    std::uint32_t written = 0;

    std::string functions, calls;
    for (std::size_t e = 0; e < state.equations.size(); ++e) {
        const auto& compiled = state.equations[e];
        const std::string fragment = compiled.byteCode->GetMetalFragment(*state.executeInfo, 5);
        if (fragment.empty()) return {}; // the device cannot express it
        const int components = compiled.byteCode->GetComponentCount();
        const std::string type = components < 2 ? "float" : "vec" + std::to_string(components);
        const std::string number = std::to_string(e + 1);
        if (cpp)
            functions +=
                "static " + type + " Process" + number + "(" + parameters + ")\n{\n" + fragment + "}\n";
        else
            functions += "__attribute__((always_inline)) inline " + type + " ProceduralProcess" + number +
                         "(" + parameters + ")\n{\n" + fragment + "}\n";
        std::string stores;
        int k = 0;
        for (int c = 0; c < channels; ++c) {
            if (!(compiled.mask & (1u << c))) continue;
            const std::string n = std::to_string(c);
            const std::string value = components < 2   ? std::string("res")
                                      : k < components ? "res.v[" + std::to_string(k) + "]"
                                                       : std::string("0.0f");
            stores += "tex" + n + "=" + value + ";";
            written |= 1u << c;
            ++k;
        }
        calls += "{const " + type + " res = " + (cpp ? "Utils::Process" : "ProceduralProcess") + number +
                 "(" + arguments + "); " + stores + "}\n";
    }

    // Blended by the mode, then mixed with the layer by the opacity. Normal has a text of its own that pays
    // nothing for the other modes, which share one text that reads the mode from the block (so that changing
    // the mode builds no new kernel).
    std::string blend;
    std::string value = "tex", stored = std::to_string(written);
    if (blended && written) {
        std::string src = "const float src[5] = {", tex = "float tex[5] = {";
        for (int c = 0; c < channels; ++c) {
            const std::string n = std::to_string(c);
            src += (c ? ",ch" : "ch") + n;
            tex += (c ? ",tex" : "tex") + n;
        }
        blend = src + "};\n" + tex + "};\nconst uint stored = ProceduralBlend((int)sampler_params[" +
                std::to_string(ProceduralTextureMath::BlendIndex) + "]," +
                std::to_string(int(config.GetColourFormat())) + "," + std::to_string(written) + "u," +
                (access->stored ? "1" : "0") + ",src,tex);\n";
        value = "tex[";
        stored = "stored";
    }
    for (int c = 0; c < channels; ++c) {
        const std::string n = std::to_string(c);
        const std::string texture = value == "tex" ? "tex" + n : "tex[" + n + "]";
        const std::string condition = "if ((" + stored + ") & " + std::to_string(1u << c) + "u) ";
        if (access->stored)
            blend += condition + "out" + n + "=ProceduralIntegerChannel(" + texture + ",raw" + n + "," +
                     access->maximum + ",opacity);\n";
        else
            blend += condition + "out" + n + "=ProceduralFloatChannel(" + texture + ",raw" + n + ",opacity," +
                     (c == channels - 1 ? "1" : "0") + ");\n";
    }

    std::string writes;
    for (int c = 0; c < channels; ++c) {
        const std::string n = std::to_string(c);
        writes += std::string("result.") + access->components[std::size_t(c)] + " = " +
                  (access->stored ? std::string("(") + access->stored + ")out" + n : "out" + n) + ";\n";
    }

    std::string body =
        Raster::FormatKernelText(SampleBody, {declarations, reads, calls, writes,
                                              std::to_string(ProceduralTextureMath::OpacityIndex), blend});
    const char* blendMath = Raster::GetBlendModeMathText(language);
    if (!blendMath) return {};
    std::string text =
        std::string(prelude) + blendMath + ProceduralTextureMath::GetProceduralTextureMathText();
    if (cpp) {
        // Language 0 keeps the equations as static functions of a local structure, beside the expression
        // prelude's namespace.
        body = "using namespace Expressions;\nstruct Utils\n{\n" + functions + "};\n" + body;
    } else {
        text += functions;
    }
    // Inlined whole into the per-pixel loop: a call left in it keeps an OpenCL compiler for processors from
    // running the work items as one straight loop.
    if (!cpp) text += "__attribute__((always_inline)) ";
    return text + MakeStage(StageSignature::Sample, body);
}

struct TextCache {
    Kernel::CriticalSectionSpin lock;
    // Each entry keeps its config alive, so that no other config can take its address.
    std::map<std::tuple<const Config*, int, int, bool>, std::pair<Config::Handle, std::string>> texts;
};

TextCache& GetTextCache() {
    static TextCache* cache = new TextCache; // kernel texts are used until the process ends
    return *cache;
}

} // namespace

const char* ProceduralTextureCommand::GetSampleText(const Config::Handle& config, const State& state,
                                                    Raster::PixelFormat format,
                                                    HardwareKernelLanguage language,
                                                    BlendModeType blendMode) {
    if (!config || blendMode < 0 || blendMode >= BlendModeCount) return nullptr;
    TextCache& cache = GetTextCache();
    std::lock_guard lock(cache.lock);
    const bool blended = blendMode != 0;
    const auto key = std::make_tuple(config.Get(), int(format), int(language), blended);
    auto found = cache.texts.find(key);
    if (found == cache.texts.end()) {
        std::string text;
        try {
            text = BuildSampleText(*config, state, format, language, blended);
        } catch (const std::bad_alloc&) {
            text.clear(); // remembered as a failure: the processor renders
        }
        found = cache.texts.emplace(key, std::make_pair(config, std::move(text))).first;
    }
    return found->second.second.empty() ? nullptr : found->second.second.c_str();
}

const char* StageText<ProceduralTextureSampler>::Get(HardwareKernelLanguage language,
                                                     Raster::PixelFormat source) {
    static const PerFormatStageText texts(
        [](Raster::PixelFormat format, HardwareKernelLanguage l) -> std::string {
            if (!DescribeFormat(format)) return {};
            if (l != HardwareKernelLanguage::CudaCpp && l != HardwareKernelLanguage::OpenCLC) return {};
            return MakeStage(StageSignature::Sample, std::string(StageBody::NearestSample) +
                                                         "\n(void)sampler_params;\n(void)sampler_bounds;\n"
                                                         "(void)sampler_pixels;");
        });
    return texts.Get(language, source);
}

// ---- The starter presets

const std::vector<ProceduralTextureConfigProperty>& ProceduralTextureCommand::GetStarterPresets() {
    static const std::vector<ProceduralTextureConfigProperty> presets = [] {
        using C = ExpressionConstant;
        struct Input {
            int kind;
            const char* name;
            const char* description;
            double minimum, maximum;
            ExpressionConstantValue value;
        };
        struct Equation {
            const char* text;
            std::uint32_t mask;
        };
        const auto make = [](std::vector<Equation> equations, std::vector<Input> inputs, bool radians) {
            std::vector<Counted<const ExpressionConstant>> constants;
            std::vector<ExpressionConstantValue> values;
            for (const Input& input : inputs) {
                constants.push_back(
                    C::Create(input.kind, input.name, input.description, input.minimum, input.maximum));
                values.push_back(input.value);
            }
            Config::Handle config = Config::CreateEmpty(Config::RGB)
                                        ->ReplaceConstantSet(Counted<const ExpressionConstantSet>(
                                            new ExpressionConstantSet(std::move(constants))))
                                        ->ChangeAnglesInRadians(radians);
            for (const Equation& equation : equations)
                config = config->AddEquation(ProceduralTextureEquation(equation.text, equation.mask));
            return ProceduralTextureConfigProperty(
                config,
                Counted<const ExpressionConstantValues>(new ExpressionConstantValues(std::move(values))));
        };
        std::vector<ProceduralTextureConfigProperty> list;
        // Stripes: a sine across x, period in pixels.
        list.push_back(make({{"sin(rx * 6.2831853 / period) * 0.5 + 0.5", 7}, {"1", 8}},
                            {{C::Real, "period", "Stripe period (pixels)", 2.0, 512.0, 32.0}}, true));
        // Rings around the origin.
        list.push_back(make({{"fract(hypot(rx, ry) / spacing)", 7}, {"1", 8}},
                            {{C::Real, "spacing", "Ring spacing (pixels)", 2.0, 512.0, 24.0}}, true));
        // Checkerboard of square cells.
        list.push_back(make({{"mod(floor(rx / size) + floor(ry / size), 2)", 7}, {"1", 8}},
                            {{C::Integer, "size", "Cell size (pixels)", 1, 1024, 16}}, true));
        // Noise marble: stripes bent by coherent noise.
        list.push_back(
            make({{"sin((rx + noise(rx / 64, ry / 64) * turbulence * 80) / 8) * 0.5 + 0.5", 7}, {"1", 8}},
                 {{C::Real, "turbulence", "Turbulence", 0.0, 4.0, 1.0}}, true));
        // A colour gradient across the document, between two colours set by inputs, lit from a direction.
        list.push_back(
            make({{"t = clamp(x / w, 0, 1); vec3(mix(r0, r1, t), mix(g0, g1, t), 0.5 + 0.5 * tilt.z)", 7},
                  {"1", 8}},
                 {{C::Percent, "r0", "Red at the left", 0.0, 1.0, 0.9},
                  {C::Percent, "r1", "Red at the right", 0.0, 1.0, 0.1},
                  {C::Percent, "g0", "Green at the left", 0.0, 1.0, 0.2},
                  {C::Percent, "g1", "Green at the right", 0.0, 1.0, 0.8},
                  {C::Vector, "tilt", "Blue from this direction's height", 0.0, 0.0,
                   ExpressionConstantValueVec{0.0, 0.5}}},
                 true));
        return list;
    }();
    return presets;
}

// ---- The command

namespace {
// The starter preset a config is, for the table's "preset"; 0 for a config of its own.
int StarterIndex(const Config::Handle& config) {
    const auto& presets = ProceduralTextureCommand::GetStarterPresets();
    for (std::size_t i = 0; i < presets.size(); ++i)
        if (presets[i].GetConfig() == config) return int(i);
    return 0;
}
} // namespace

ProceduralTextureCommand::ProceduralTextureCommand()
    : m_Config(GetStarterPresets()[0].GetConfig())
    , m_Values(GetStarterPresets()[0].GetValues()) {}

ProceduralTextureCommand::ProceduralTextureCommand(bool liveEffect, const Kernel::PointT<double>& origin,
                                                   double opacity, BlendModeType blendMode,
                                                   const Config::Handle& config,
                                                   const Counted<const ExpressionConstantValues>& values)
    : SinglePassCommand(liveEffect, ProceduralTextureParameters{0, origin, opacity})
    , m_BlendMode(blendMode >= 0 && blendMode < BlendModeCount ? blendMode : 0)
    , m_Config(config)
    , m_Values(values) {
    m_Params.preset = StarterIndex(m_Config);
}

ProceduralTextureCommand::ProceduralTextureCommand(bool liveEffect, const ProceduralTextureParameters& params)
    : SinglePassCommand(liveEffect, params) {
    const auto& presets = GetStarterPresets();
    const auto& preset = presets[std::size_t(std::clamp(m_Params.preset, 0, int(presets.size()) - 1))];
    m_Config = preset.GetConfig();
    m_Values = preset.GetValues();
}

std::shared_ptr<const ProceduralTextureState>
ProceduralTextureCommand::GetState(Raster::PixelFormat format) const {
    const auto index = static_cast<std::size_t>(format);
    if (index >= m_States.size()) return nullptr;
    std::lock_guard lock(m_StateMutex);
    if (!m_StateTried[index]) {
        m_StateTried[index] = true;
        auto state = std::make_shared<State>();
        // The origin and size bound here are placeholders: every render reads its own from the block.
        if (Init(format, {1.0, 1.0}, 72.0, m_Params.origin, m_Config, m_Values, *state))
            m_States[index] = state;
    }
    return m_States[index];
}

ProceduralTextureSampler::Params
ProceduralTextureCommand::GetSamplerParams(const Kernel::RectT<double>& bounds,
                                           const Raster::AffineTransform::Params& view) const {
    ProceduralTextureSampler::Params params;
    // Raster pixel centres to document pixels: the inverse of the view, then the raster's place.
    const auto inverse = Raster::AffineTransform::Invert(view).m;
    for (int i = 0; i < 6; ++i)
        params.block[i] = float(inverse[std::size_t(i)]);
    params.block[2] = float(inverse[2] + bounds.left);
    params.block[5] = float(inverse[5] + bounds.top);
    params.block[6] = float(m_Params.origin.x);
    params.block[7] = float(m_Params.origin.y);
    params.block[8] = float(bounds.Width());
    params.block[9] = float(bounds.Height());
    params.block[ProceduralTextureMath::OpacityIndex] = float(m_Params.opacity);
    params.block[ProceduralTextureMath::BlendIndex] = float(m_BlendMode);
    int slot = ProceduralTextureMath::FirstInputSlot;
    const int end = ProceduralTextureMath::FirstInputSlot + ProceduralTextureMath::InputSlots;
    if (!m_Config) return params;
    const ExpressionConstantSet& set = m_Config->GetConstantSet();
    for (std::size_t i = 0; i < set.GetCount(); ++i) {
        const int components = set.Get(i).IsVector() ? 3 : 1;
        if (slot + components > end) break; // such a config has no device text
        const auto value = InputValue(set.Get(i), m_Values.Get(), i);
        for (int c = 0; c < components; ++c)
            params.block[slot + c] = float(value[std::size_t(c)]);
        slot += components;
    }
    return params;
}

template <class Stages>
std::optional<Raster::HardwareKernelDescriptor> ProceduralTextureCommand::Describe(const RenderTarget& target,
                                                                                   const State* state) const {
    const Raster::HardwareDevice* device = target.device.Get();
    if (!device) return std::nullopt;
    const auto language = Raster::GetKernelLanguage(device);
    auto descriptor = DescribeKernel<Stages>(language, GetKernelShape<Stages>(target));
    if (!descriptor || !state) return descriptor;
    const char* text =
        GetSampleText(m_Config, *state, target.source.pixels->GetFormat(), language, m_BlendMode);
    if (!text) return std::nullopt;
    (*descriptor)[Raster::HardwareKernelFragment::Sample] = text;
    return descriptor;
}

template <class Stages>
RenderPath ProceduralTextureCommand::RenderWith(const RenderTarget& target) const {
    if (!CanRender<Stages>(target)) return RenderPath::Failed;
    const Kernel::RectT<int> rect = target.rect.Intersect(target.destination.pixels->GetBounds());
    if (rect.IsEmpty()) return RenderPath::Nothing;
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;

    // A config that does not compile for this format renders nothing: the pixels as they are.
    const std::shared_ptr<const State> state = GetState(target.source.pixels->GetFormat());
    typename Stages::Params params{};
    params.sampler = GetSamplerParams(target.bounds, target.transform);

    const Raster::HardwareDevice* device = target.device.Get();
    if (device && Raster::ShouldExecuteKernel(rect)) {
        const auto descriptor = Describe<Stages>(target, state.get());
        if (descriptor && !Raster::IsKernelBroken(*descriptor, device) &&
            !Raster::IsKernelPendingCompilation(*descriptor, device, false, target.abort)) {
            const std::vector<float> array =
                BuildKernelParams<Stages>(target, GetKernelShape<Stages>(target), params);
            if (array.size() <= MaxKernelParams && ExecuteOnDevice(target, rect, *descriptor, array)) {
                Detail::SetCompleted(target.completed);
                return RenderPath::Device;
            }
        }
    }
    if (Kernel::IsAborted(target.abort)) return RenderPath::Aborted;
    Raster::Hardware::IncrementFailedKernels(device);
    return Detail::RenderOnProcessor(target, rect, [&] {
        // This thread's own sessions, for this rectangle.
        std::optional<ProceduralTextureEvaluator> evaluator;
        if (state) {
            evaluator.emplace(*state, params.sampler.block);
            params.sampler.evaluator = &*evaluator;
        }
        return RunProcessor<Stages>(target, rect, params) ? RenderPath::Processor : RenderPath::Aborted;
    });
}

RenderPath ProceduralTextureCommand::Render(const RenderTarget& target) const {
    if (!target.source) return RenderPath::Failed;
    RenderPath path = RenderPath::Failed;
    LayerFormatList::Dispatch(target.source.pixels->GetFormat(), [&](auto format) {
        constexpr Raster::PixelFormat F = decltype(format)::value;
        path = target.mask ? RenderWith<MaskedStages<F>>(target) : RenderWith<PlainStages<F>>(target);
        return true;
    });
    return path;
}

bool ProceduralTextureCommand::PrepareDevice(const RenderTarget& target) const {
    if (!target.source || !target.device) return false;
    bool ready = false;
    LayerFormatList::Dispatch(target.source.pixels->GetFormat(), [&](auto format) {
        constexpr Raster::PixelFormat F = decltype(format)::value;
        const auto wait = [&](auto stages) {
            using Stages = decltype(stages);
            if (!CanRender<Stages>(target)) return false;
            const auto state = GetState(F);
            const auto descriptor = Describe<Stages>(target, state.get());
            if (!descriptor) return false;
            Raster::IsKernelPendingCompilation(*descriptor, target.device.Get(), true, target.abort);
            return !Raster::IsKernelBroken(*descriptor, target.device.Get());
        };
        ready = target.mask ? wait(MaskedStages<F>{}) : wait(PlainStages<F>{});
        return true;
    });
    return ready;
}

bool ProceduralTextureCommand::Merge(Counted<const Command> other) {
    const auto* same = dynamic_cast<const ProceduralTextureCommand*>(other.Get());
    if (!same || !SinglePassCommand::Merge(other)) return false;
    m_BlendMode = same->m_BlendMode;
    m_Config = same->m_Config;
    m_Values = same->m_Values;
    std::lock_guard lock(m_StateMutex);
    m_States = {};
    m_StateTried = {};
    return true;
}

Counted<DocumentCommand> ProceduralTextureCommand::Clone() const {
    return Counted<DocumentCommand>(new ProceduralTextureCommand(
        IsLiveEffect(), m_Params.origin, m_Params.opacity, m_BlendMode, m_Config, m_Values));
}

Kernel::ReflectedList ProceduralTextureCommand::EnumerateReflecteds() {
    Kernel::ReflectedList list;
    const Counted<Kernel::Countable> owner(this);
    for (const auto& reflected : SinglePassCommand::EnumerateReflecteds())
        if (reflected->GetIdentifier() != Kernel::MakeFourCC("prst")) list.push_back(reflected);
    list.push_back(Counted<Kernel::Reflected>(new Kernel::ReflectedBlendMode(
        Kernel::MakeFourCC("BleM"), Kernel::LocalisedString("Blend mode", "Reflected property"),
        [owner, this] { return m_BlendMode; },
        [owner, this](int mode) {
            if (mode >= 0 && mode < BlendModeCount) m_BlendMode = mode;
        })));
    return list;
}

// The config, the input values, the origin, the blend mode and the opacity, then the base's data.
void ProceduralTextureCommand::Save(Kernel::OutSerialiser& out) const {
    if (m_Config) out.SaveObject(Kernel::MakeFourCC("Cnfg"), *m_Config);
    if (m_Values) out.SaveObject(Kernel::MakeFourCC("CVls"), *m_Values);
    out.SaveType(Kernel::MakeFourCC("Orgn"), m_Params.origin);
    out.SaveType(Kernel::MakeFourCC("BleM"), std::int32_t(m_BlendMode));
    out.SaveType(Kernel::MakeFourCC("Opac"), m_Params.opacity);
    RasterDevicePreviewableFilterLayerCommand::Save(out);
}

bool ProceduralTextureCommand::Load(const Kernel::InSerialiser& in, Kernel::FileStore& store,
                                    unsigned short version) {
    const Counted<Kernel::Serialisable> config = in.LoadObject(Kernel::MakeFourCC("Cnfg"), store);
    const auto* loadedConfig = dynamic_cast<const Config*>(config.Get());
    if (!loadedConfig) return false;
    m_Config = Config::Consolidate(*loadedConfig);
    m_Params.preset = StarterIndex(m_Config);
    // A stored object of another class is no value set: the defaults are used.
    const Counted<Kernel::Serialisable> values = in.LoadObject(Kernel::MakeFourCC("CVls"), store);
    m_Values =
        Counted<const ExpressionConstantValues>(dynamic_cast<const ExpressionConstantValues*>(values.Get()));
    in.LoadType(Kernel::MakeFourCC("Orgn"), m_Params.origin);
    std::int32_t blend = 0;
    if (in.LoadType(Kernel::MakeFourCC("BleM"), blend) && blend >= 0 && blend < BlendModeCount)
        m_BlendMode = blend;
    in.LoadType(Kernel::MakeFourCC("Opac"), m_Params.opacity);
    BoundParameters(m_Params, ProceduralTextureFilter::kParameters);
    {
        std::lock_guard lock(m_StateMutex);
        m_States = {};
        m_StateTried = {};
    }
    return RasterDevicePreviewableFilterLayerCommand::Load(in, store, version);
}

} // namespace RasterTools
