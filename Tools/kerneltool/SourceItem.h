#pragma once

#include "libkernel/archive/Archive.h"
#include "libkernel/filestore/FileStoreItem.h"

#include <cstdio>
#include <memory>
#include <string>

namespace KernelTool {

class LongWork;

/// Where an item's bytes come from: a file, or a stream without an end that was copied to a nameless temporary file,
/// because an item's bytes are read twice. Throws Failure for what can't be read.
class Source
{
public:
    /// A regular file; a pipe or device is copied.
    static Source FromPath(Kernel::String8 const& path);
    static Source FromStandardInput();

    Kernel::u64 GetSize() const { return m_size; }
    std::string const& GetName() const { return m_name; }
    Kernel::String8 const& GetPath() const { return m_path; }

    using Stream = std::unique_ptr<std::FILE, int (*)(std::FILE*)>;
    /// At the first byte.
    Stream Open() const;
    /// Bytes read, fewer at the end.
    Kernel::u64 Read(Stream const& stream, void* to, Kernel::u64 count) const;

private:
    void Spool(std::FILE* in);

    std::string m_name;
    Kernel::String8 m_path;             // Empty for a copy.
    std::shared_ptr<std::FILE> m_spool; // Null for a file.
    Kernel::u64 m_size = 0;
};

/// True if the item at @p path has these bytes. A damaged item has not. Tells @p work of the bytes it compares.
bool HasSameBytes(Kernel::Archive& archive, Kernel::String8 const& path, Source const& source, LongWork& work);

/// An item whose bytes are read from their source while it is saved, a piece at a time. @p work is borrowed.
class SourceItem : public Kernel::FileStoreItem
{
public:
    SourceItem(Source source, LongWork& work) : m_source(std::move(source)), m_work(work) {}

    void Save(Kernel::OutStream& stream, Kernel::FileStoreOut& out) const override;
    /// Never: the tool reads items as streams.
    bool Load(Kernel::InStream& stream, Kernel::FileStore& store) override;
    Kernel::FileStoreItemType const* GetObjectFileStoreItemType() const override;

private:
    ~SourceItem() override;

    Source const m_source;
    LongWork& m_work;
};

} // namespace KernelTool
