// The unsharp mask processor renders of RGBAUF layers.
#include "filters/tonal/UnsharpMaskRender.inl"

RT_INSTANTIATE_UNSHARP_MASK(RGBAUF)
