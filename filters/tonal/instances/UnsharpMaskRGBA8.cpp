// The unsharp mask processor renders of RGBA8 layers.
#include "filters/tonal/UnsharpMaskRender.inl"

RT_INSTANTIATE_UNSHARP_MASK(RGBA8)
