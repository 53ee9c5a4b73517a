// The sphere processor renders of CMYKA8 layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Sphere, CMYKA8)
