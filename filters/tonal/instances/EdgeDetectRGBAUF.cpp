// The vertical edge detect processor renders of RGBAUF layers.
#include "filters/tonal/EdgeDetectStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_EDGE_DETECT(RGBAUF)
