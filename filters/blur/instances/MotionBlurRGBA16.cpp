// The motion blur processor renders of RGBA16 layers.
#include "filters/blur/MotionBlurRender.inl"

RT_INSTANTIATE_MOTION_BLUR(RGBA16)
