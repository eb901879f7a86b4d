#include "libkernel/core/Countable.h"

namespace Kernel {

Countable::~Countable() = default;
VoidClass::~VoidClass() = default;

} // namespace Kernel
