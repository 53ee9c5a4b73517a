// The sphere processor renders of RGBAUF layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Sphere, RGBAUF)
