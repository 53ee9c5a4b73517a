// The add-noise processor renders of RGBAUF layers.
#include "filters/tonal/NoiseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_NOISE(RGBAUF)
