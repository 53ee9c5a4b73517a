#pragma once
// Messages that the host passes between its parts (tools, panels, documents).

#include "host/kernel/Countable.h"

#include <string>

namespace Kernel {

// Base of every notification; Describe() names it and its payload for logs.
class Notification : public virtual Countable {
public:
    virtual std::string Describe() const = 0;
};

// Asks observers of a reflectable object to enumerate its properties again.
class InvalidateReflectedsNotification : public Notification {
public:
    std::string Describe() const override { return "InvalidateReflecteds"; }
};

} // namespace Kernel
