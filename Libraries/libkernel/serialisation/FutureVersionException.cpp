#include "libkernel/serialisation/FutureVersionException.h"

namespace Kernel {

FutureVersionException::~FutureVersionException() = default;

UnknownClassUIDException::~UnknownClassUIDException() = default;

} // namespace Kernel
