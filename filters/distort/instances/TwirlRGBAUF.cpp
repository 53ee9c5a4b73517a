// The twirl processor renders of RGBAUF layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Twirl, RGBAUF)
