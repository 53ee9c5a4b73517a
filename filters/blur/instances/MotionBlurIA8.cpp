// The motion blur processor renders of IA8 layers.
#include "filters/blur/MotionBlurRender.inl"

RT_INSTANTIATE_MOTION_BLUR(IA8)
