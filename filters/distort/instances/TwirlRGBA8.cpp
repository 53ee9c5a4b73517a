// The twirl processor renders of RGBA8 layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Twirl, RGBA8)
