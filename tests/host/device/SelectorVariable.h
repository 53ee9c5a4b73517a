#pragma once
// Sets or clears RASTERTOOLS_DEVICE for one scope, for tests of device selection.

#include "host/raster/device/Hardware.h"

#include <cstdlib>
#include <optional>
#include <string>

namespace DeviceTest {

class SelectorVariable {
public:
    explicit SelectorVariable(const char* value) {
        if (const char* old = std::getenv(Raster::Hardware::SelectorVariable)) m_Old = old;
        if (value)
            ::setenv(Raster::Hardware::SelectorVariable, value, 1);
        else
            ::unsetenv(Raster::Hardware::SelectorVariable);
    }
    ~SelectorVariable() {
        if (m_Old)
            ::setenv(Raster::Hardware::SelectorVariable, m_Old->c_str(), 1);
        else
            ::unsetenv(Raster::Hardware::SelectorVariable);
    }
    SelectorVariable(const SelectorVariable&) = delete;
    SelectorVariable& operator=(const SelectorVariable&) = delete;

private:
    std::optional<std::string> m_Old;
};

} // namespace DeviceTest
