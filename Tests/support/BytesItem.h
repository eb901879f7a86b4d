#pragma once

#include "libkernel/filestore/FileStoreCompressionHint.h"
#include "libkernel/filestore/FileStoreItem.h"

#include <functional>
#include <string>

namespace KernelTest {

/// An item that is plain bytes.
class BytesItem : public Kernel::FileStoreItem
{
public:
    static Kernel::FileStoreItemType const c_type;

    explicit BytesItem(std::string b = {}) : bytes(std::move(b)) {}

    void Save(Kernel::OutStream& stream, Kernel::FileStoreOut& out) const override;
    bool Load(Kernel::InStream& stream, Kernel::FileStore& store) override;
    Kernel::FileStoreItemType const* GetObjectFileStoreItemType() const override { return &c_type; }

    std::string bytes;
    std::function<void(Kernel::FileStoreOut&)> onSave; ///< Called before the bytes are written.

protected:
    ~BytesItem() override;
};

/// The hint for zstd at the default level.
Kernel::Counted<Kernel::FileStoreCompressionHint> Compressed();

} // namespace KernelTest
