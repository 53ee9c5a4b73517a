// The diffuse processor renders of RGBA16 layers.
#include "filters/tonal/DiffuseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DIFFUSE(RGBA16)
