#pragma once

#include "libkernel/core/Limits.h"
#include "libkernel/core/Types.h"

namespace Kernel {

/// One level of nesting on this thread's stack, for as long as the guard lives. Parses, saves and loads of items on
/// demand share one count, since each can run inside the other and all of them live on the same stack.
///
///     NestingGuard const level;
///     if (!level.IsAllowed()) return false;
class KERNEL_API NestingGuard
{
public:
    NestingGuard() : m_depth(GetDepth()) { ++m_depth; }
    ~NestingGuard() { --m_depth; }
    NestingGuard(NestingGuard const&) = delete;
    NestingGuard& operator=(NestingGuard const&) = delete;

    /// False if this level is one too many: c_maxNesting levels may be open at once.
    bool IsAllowed() const { return m_depth <= c_maxNesting; }

    /// Guards open on this thread. Only guards write it.
    static u32& GetDepth();

private:
    u32& m_depth;
};

} // namespace Kernel
