#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

namespace Kernel {

/// The path of the file that a scratch or temporary file stands for. Stored in a new file as its reference path and
/// read back with it. Never changes once made; any thread may read it.
class KERNEL_API ArchiveReferenceInfo : public Countable
{
public:
    explicit ArchiveReferenceInfo(String8 const& path);
    String8 const& GetPath() const { return m_path; }

private:
    ~ArchiveReferenceInfo() override;

    String8 const m_path;
};

} // namespace Kernel
