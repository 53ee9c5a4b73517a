#pragma once
// Marks objects that the host's user-interface scheduler may call back.

#include "host/kernel/Countable.h"

namespace Kernel {

class Schedulable : public virtual Countable {};

} // namespace Kernel
