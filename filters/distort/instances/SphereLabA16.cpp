// The sphere processor renders of LabA16 layers.
#include "filters/distort/DistortStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DISTORT(Sphere, LabA16)
