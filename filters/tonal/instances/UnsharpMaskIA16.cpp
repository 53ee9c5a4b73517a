// The unsharp mask processor renders of IA16 layers.
#include "filters/tonal/UnsharpMaskRender.inl"

RT_INSTANTIATE_UNSHARP_MASK(IA16)
