// The motion blur processor renders of RGBA8 layers.
#include "filters/blur/MotionBlurRender.inl"

RT_INSTANTIATE_MOTION_BLUR(RGBA8)
