// The copy's processor renders into RGBAUF destinations.
#include "filters/copy/CopyStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_COPY(RGBAUF)
