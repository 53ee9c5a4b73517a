// The parameter array of a pipeline kernel.
#include "pipeline/KernelAssembly.h"

namespace RasterTools {

std::vector<float> BuildParameterArray(const std::array<std::vector<float>, ParamBlockCount>& blocks) {
    std::vector<float> array(ParamHeaderSize);
    for (std::size_t b = 0; b < ParamBlockCount; ++b) {
        array[b] = float(array.size());
        array.insert(array.end(), blocks[b].begin(), blocks[b].end());
    }
    return array;
}

} // namespace RasterTools
