// The vertical edge detect processor renders of RGBA16 layers.
#include "filters/tonal/EdgeDetectStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_EDGE_DETECT(RGBA16)
