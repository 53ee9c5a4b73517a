// The unsharp mask processor renders of CMYKA8 layers.
#include "filters/tonal/UnsharpMaskRender.inl"

RT_INSTANTIATE_UNSHARP_MASK(CMYKA8)
