// The unsharp mask processor renders of IA8 layers.
#include "filters/tonal/UnsharpMaskRender.inl"

RT_INSTANTIATE_UNSHARP_MASK(IA8)
