// The diffuse processor renders of CMYKA8 layers.
#include "filters/tonal/DiffuseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DIFFUSE(CMYKA8)
