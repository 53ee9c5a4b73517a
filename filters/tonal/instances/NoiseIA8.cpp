// The add-noise processor renders of IA8 layers.
#include "filters/tonal/NoiseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_NOISE(IA8)
