// The motion blur processor renders of RGBAUF layers.
#include "filters/blur/MotionBlurRender.inl"

RT_INSTANTIATE_MOTION_BLUR(RGBAUF)
