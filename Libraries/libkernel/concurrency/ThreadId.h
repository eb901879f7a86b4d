#pragma once

#include "libkernel/core/Types.h"

#include <cstddef>

namespace Kernel {

/// The operating system's id of a thread, as a value. Ids come again once their thread has ended.
class KERNEL_API ThreadId
{
public:
    /// The id of no thread.
    ThreadId(std::nullptr_t) {}

    static ThreadId GetCurrent();

    void const* GetId() const { return reinterpret_cast<void const*>(m_id); }
    friend bool operator==(ThreadId const& a, ThreadId const& b) = default;

private:
    explicit ThreadId(u64 id) : m_id(id) {}

    u64 m_id = 0;
};

} // namespace Kernel
