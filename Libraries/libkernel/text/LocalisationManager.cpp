#include "libkernel/text/LocalisationManager.h"

namespace Kernel {

LocalisationManager& LocalisationManager::GetInstance()
{
    static LocalisationManager s_instance;
    return s_instance;
}

} // namespace Kernel
