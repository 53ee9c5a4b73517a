// The diffuse processor renders of RGBAUF layers.
#include "filters/tonal/DiffuseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DIFFUSE(RGBAUF)
