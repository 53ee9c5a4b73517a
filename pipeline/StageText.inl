// Template bodies of StageText.h: composed texts are built once per language and kept for the process.

#include "host/raster/KernelText.h"

namespace RasterTools {

namespace Detail {
// A part of a chain: a nested chain is rebuilt with its place's prefix, anything else is its own text.
template <class Part>
std::string ChainPartText(HardwareKernelLanguage language, const std::string& prefix, int level) {
    if constexpr (requires { StageText<Part>::Build(language, prefix, level); }) {
        return StageText<Part>::Build(language, prefix, level);
    } else {
        const char* text = StageText<Part>::Get(language);
        return text ? std::string(text) : std::string();
    }
}
} // namespace Detail

template <class Left, class Right>
std::string StageText<Raster::ChainedTransform<Left, Right>>::Build(HardwareKernelLanguage language,
                                                                    const std::string& prefix, int level) {
    const std::string left = Detail::ChainPartText<Left>(language, prefix + "L", level + 1);
    const std::string right = Detail::ChainPartText<Right>(language, prefix + "R", level + 1);
    if (left.empty() || right.empty()) return {};
    return ChainTransforms(language, left, right, prefix, level);
}

template <class Left, class Right>
const char* StageText<Raster::ChainedTransform<Left, Right>>::Get(HardwareKernelLanguage language) {
    static const Raster::KernelTextPair texts([](HardwareKernelLanguage l) { return Build(l, {}, 1); });
    return texts.Get(language);
}

template <class Left, class Right>
std::string StageText<Raster::ChainedMask<Left, Right>>::Build(HardwareKernelLanguage language,
                                                               const std::string& prefix, int level) {
    const std::string left = Detail::ChainPartText<Left>(language, prefix + "L", level + 1);
    const std::string right = Detail::ChainPartText<Right>(language, prefix + "R", level + 1);
    if (left.empty() || right.empty()) return {};
    return ChainReadMasks(language, left, right, prefix);
}

template <class Left, class Right>
const char* StageText<Raster::ChainedMask<Left, Right>>::Get(HardwareKernelLanguage language) {
    static const Raster::KernelTextPair texts([](HardwareKernelLanguage l) { return Build(l, {}, 1); });
    return texts.Get(language);
}

template <class Transform>
const char* GetTransformStageText(HardwareKernelLanguage language) {
    static const Raster::KernelTextPair texts([](HardwareKernelLanguage l) -> std::string {
        const char* transform = StageText<Transform>::Get(l);
        const char* helpers = GetTransformHelpersText(l);
        if (!transform || !helpers) return {};
        return std::string(transform) + helpers;
    });
    return texts.Get(language);
}

} // namespace RasterTools
