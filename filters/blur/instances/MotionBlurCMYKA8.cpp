// The motion blur processor renders of CMYKA8 layers.
#include "filters/blur/MotionBlurRender.inl"

RT_INSTANTIATE_MOTION_BLUR(CMYKA8)
