// The add-noise processor renders of RGBA8 layers.
#include "filters/tonal/NoiseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_NOISE(RGBA8)
