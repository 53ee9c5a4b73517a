// The unsharp mask processor renders of LabA16 layers.
#include "filters/tonal/UnsharpMaskRender.inl"

RT_INSTANTIATE_UNSHARP_MASK(LabA16)
