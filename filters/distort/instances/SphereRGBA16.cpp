// The sphere processor renders of RGBA16 layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Sphere, RGBA16)
