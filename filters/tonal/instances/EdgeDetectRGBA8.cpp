// The vertical edge detect processor renders of RGBA8 layers.
#include "filters/tonal/EdgeDetectStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_EDGE_DETECT(RGBA8)
