// The unsharp mask processor renders of RGBA16 layers.
#include "filters/tonal/UnsharpMaskRender.inl"

RT_INSTANTIATE_UNSHARP_MASK(RGBA16)
