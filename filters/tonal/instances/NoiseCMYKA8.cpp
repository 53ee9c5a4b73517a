// The add-noise processor renders of CMYKA8 layers.
#include "filters/tonal/NoiseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_NOISE(CMYKA8)
