#pragma once

#include "libkernel/filestore/FileStoreOut.h"

namespace Kernel {

/// Names a delay-loaded item that its store does not know yet.
class KERNEL_API FileStoreOutPathGenerator
{
public:
    FileStoreOutPathGenerator() = default;
    FileStoreOutPathGenerator(FileStoreOutPathGenerator const&) = delete;
    FileStoreOutPathGenerator& operator=(FileStoreOutPathGenerator const&) = delete;
    virtual ~FileStoreOutPathGenerator();

    /// False if no path can be made. Item and holder may be null.
    virtual bool GeneratePath(NonCounted<FileStoreItem const> item, NonCounted<DelayLoadHolder const> holder,
                              String8& path) = 0;
};

/// Takes the next indexed path of a FileStoreOut.
class KERNEL_API FileStoreOutIndexedPathGenerator : public FileStoreOutPathGenerator
{
public:
    /// @p out is borrowed for the life of the generator.
    FileStoreOutIndexedPathGenerator(FileStoreOut& out, String8 const& prefix, String8 const& suffix);
    FileStoreOutIndexedPathGenerator(FileStoreOut& out, FileStoreOut::IndexedPathParts const& parts);
    ~FileStoreOutIndexedPathGenerator() override;

    bool GeneratePath(NonCounted<FileStoreItem const> item, NonCounted<DelayLoadHolder const> holder,
                      String8& path) override;

private:
    FileStoreOut& m_out;
    FileStoreOut::IndexedPathParts const m_parts;
};

} // namespace Kernel
