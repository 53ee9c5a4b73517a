// The motion blur processor renders of IA16 layers.
#include "filters/blur/MotionBlurRender.inl"

RT_INSTANTIATE_MOTION_BLUR(IA16)
