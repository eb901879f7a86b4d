#include "libkernel/serialisation/CompareContext.h"

namespace Kernel {

CompareContext::CompareContext() = default;
CompareContext::~CompareContext() = default;

} // namespace Kernel
