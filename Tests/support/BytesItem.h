#pragma once

#include "libkernel/filestore/FileStoreCompressionHint.h"
#include "libkernel/filestore/FileStoreItem.h"

#include <functional>
#include <string>

namespace KernelTest {

using namespace Kernel;

/// An item that is plain bytes.
class BytesItem : public FileStoreItem
{
public:
    static FileStoreItemType const c_type;

    explicit BytesItem(std::string b = {}) : bytes(std::move(b)) {}

    void Save(OutStream& stream, FileStoreOut& out) const override;
    bool Load(InStream& stream, FileStore& store) override;
    FileStoreItemType const* GetObjectFileStoreItemType() const override { return &c_type; }

    std::string bytes;
    std::function<void(FileStoreOut&)> onSave; ///< Called before the bytes are written.

protected:
    ~BytesItem() override;
};

/// The hint for zstd at the default level.
Counted<FileStoreCompressionHint> Compressed();

} // namespace KernelTest
