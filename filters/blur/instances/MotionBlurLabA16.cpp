// The motion blur processor renders of LabA16 layers.
#include "filters/blur/MotionBlurRender.inl"

RT_INSTANTIATE_MOTION_BLUR(LabA16)
