// The add-noise processor renders of LabA16 layers.
#include "filters/tonal/NoiseStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_NOISE(LabA16)
