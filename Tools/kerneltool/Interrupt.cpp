#include "Interrupt.h"

#include "libkernel/core/Abortable.h"
#include "libkernel/core/Exception.h"

#include <atomic>
#include <csignal>

namespace KernelTool {

namespace {

alignas(std::atomic_ref<bool>::required_alignment) bool s_abort = false;
static_assert(std::atomic_ref<bool>::is_always_lock_free); // A signal handler may not wait.

extern "C" void OnInterrupt(int)
{
    std::signal(SIGINT, SIG_DFL);
    std::atomic_ref<bool>(s_abort).store(true);
}

} // namespace

void CatchInterrupts()
{
    std::signal(SIGINT, OnInterrupt);
}

bool const* GetAbortFlag()
{
    return &s_abort;
}

bool IsInterrupted()
{
    return Kernel::IsAbortFlagSet(&s_abort);
}

void StopIfInterrupted()
{
    if (IsInterrupted()) throw Kernel::AbortException();
}

} // namespace KernelTool
