// The copy's processor renders into IA8 destinations.
#include "filters/copy/CopyStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_COPY(IA8)
