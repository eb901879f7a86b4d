#include "libkernel/core/NestingGuard.h"

namespace Kernel {

namespace {

// At a fixed place in the thread's block: every object that is saved or read asks, and the general form is a call into
// the loader. Four bytes fit into what each thread keeps for libraries that are opened late.
thread_local u32 s_depth __attribute__((tls_model("initial-exec"))) = 0;

} // namespace

u32& NestingGuard::GetDepth()
{
    return s_depth;
}

} // namespace Kernel
