// The twirl processor renders of RGBA16 layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Twirl, RGBA16)
