// The copy's processor renders into LabA16 destinations.
#include "filters/copy/CopyStages.h"
#include "pipeline/ProcessorInstances.h"

RT_INSTANTIATE_COPY(LabA16)
