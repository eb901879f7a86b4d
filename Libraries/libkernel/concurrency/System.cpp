#include "libkernel/concurrency/System.h"

#include "libkernel/platform/Thread.h"

namespace Kernel {

int System::GetCpuCount(bool logical)
{
    static Platform::CpuCounts const counts = Platform::CountCpus();
    return logical ? counts.logical : counts.cores;
}

u64 System::GetRamCount()
{
    return Platform::GetMemorySize() / 1024 * 1024;
}

String8 System::GetHostName()
{
    char name[256];
    return Platform::GetHostName(name, sizeof name) ? String8(name) : String8();
}

String8 System::GetUserNameW()
{
    char name[256];
    return Platform::GetUserName(name, sizeof name) ? String8(name) : String8();
}

} // namespace Kernel
