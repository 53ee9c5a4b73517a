// The twirl processor renders of IA8 layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Twirl, IA8)
