// The diffuse processor renders of IA8 layers.
#include "filters/tonal/DiffuseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_DIFFUSE(IA8)
