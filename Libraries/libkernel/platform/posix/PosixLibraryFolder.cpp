#include "libkernel/platform/LibraryFolder.h"
#include "libkernel/platform/PlatformFile.h"

#include <cstring>
#include <dlfcn.h>

namespace Kernel::Platform {

std::string GetLibraryFolder()
{
    // Any address of the library's own will do. For the program itself the name may be no more than its first argument.
    static constexpr char s_here = 0;
    Dl_info info{};
    bool const isKnown = dladdr(&s_here, &info) != 0 && info.dli_fname && std::strstr(info.dli_fname, ".so");
    return GetFolderOf(isKnown ? info.dli_fname : GetExecutablePath().c_str());
}

} // namespace Kernel::Platform
