#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// What a store talks to while a document is being read: takes the problems that do not end the reading. One thread.
class KERNEL_API FileStoreLoadContext
{
public:
    FileStoreLoadContext() = default;
    FileStoreLoadContext(FileStoreLoadContext const&) = delete;
    FileStoreLoadContext& operator=(FileStoreLoadContext const&) = delete;
    virtual ~FileStoreLoadContext();

    /// Takes the text of one problem, such as "Missing file: Images/7".
    virtual void ReportProblem(String8 const& text) = 0;

    /// True once the reading was told to stop.
    bool WasAborted() const { return m_aborted; }
    void SetAborted() { m_aborted = true; }

private:
    bool m_aborted = false;
};

} // namespace Kernel
