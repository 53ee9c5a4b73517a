// The twirl processor renders of LabA16 layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Twirl, LabA16)
