// The copy's processor renders into RGBA8 destinations.
#include "filters/copy/CopyStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_COPY(RGBA8)
