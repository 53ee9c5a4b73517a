#pragma once
// The base of brush commands that erase: they take alpha away under the dab.

#include "host/brush/RasterBrushCommand.h"

namespace RasterTools {

class RasterEraseBrushCommand : public RasterBrushCommand {
public:
    using RasterBrushCommand::RasterBrushCommand;
    const Kernel::ClassProperties& GetObjectClassProperties() const override { return ms_ClassProperties; }
    static const Kernel::ClassProperties& GetTypeClassProperties() { return ms_ClassProperties; }

private:
    static const Kernel::ClassProperties ms_ClassProperties;
};

} // namespace RasterTools
