// The diffuse processor renders of LabA16 layers.
#include "filters/tonal/DiffuseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DIFFUSE(LabA16)
