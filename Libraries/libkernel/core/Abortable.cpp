#include "libkernel/core/Abortable.h"

#include <atomic>

namespace Kernel {
namespace {

// A flag is one fact that orders nothing else, so relaxed access is enough.
bool ReadFlag(bool const& flag)
{
    return std::atomic_ref<bool>(const_cast<bool&>(flag)).load(std::memory_order_relaxed);
}

void WriteFlag(bool& flag, bool value)
{
    std::atomic_ref<bool>(flag).store(value, std::memory_order_relaxed);
}

} // namespace

Abortable::Abortable(Abortable const& o)
    : m_abort(o.m_abort == &o.m_ownAbort ? &m_ownAbort : o.m_abort), m_ownAbort(ReadFlag(o.m_ownAbort))
{
}

Abortable& Abortable::operator=(Abortable const& o)
{
    if (this == &o) return *this;
    WriteFlag(m_ownAbort, ReadFlag(o.m_ownAbort));
    m_abort = o.m_abort == &o.m_ownAbort ? &m_ownAbort : o.m_abort;
    return *this;
}

Abortable::~Abortable() = default;

void Abortable::SetAbort(bool abort)
{
    WriteFlag(*m_abort, abort);
}

bool Abortable::IsAborting() const
{
    return ReadFlag(*m_abort);
}

void Abortable::SetAbortPointer(bool* abort)
{
    m_abort = abort ? abort : &m_ownAbort;
}

bool IsAbortFlagSet(bool const* flag)
{
    return flag && ReadFlag(*flag);
}

} // namespace Kernel
