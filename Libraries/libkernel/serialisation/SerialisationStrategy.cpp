#include "libkernel/serialisation/SerialisationStrategy.h"

namespace Kernel {

SerialisationStrategy::~SerialisationStrategy() = default;

} // namespace Kernel
