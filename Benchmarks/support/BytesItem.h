#pragma once

#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/streams/OutStream.h"

#include <string>

namespace Bench {

/// An item of plain bytes, which outlive every save.
class BytesItem : public Kernel::FileStoreItem
{
public:
    explicit BytesItem(std::string const& bytes) : m_bytes(bytes) {}
    void Save(Kernel::OutStream& out, Kernel::FileStoreOut&) const override
    {
        out.WriteBlock(m_bytes.data(), m_bytes.size());
    }
    bool Load(Kernel::InStream&, Kernel::FileStore&) override { return false; }
    Kernel::FileStoreItemType const* GetObjectFileStoreItemType() const override
    {
        static Kernel::FileStoreItemType const s_type(Kernel::ClassUID("Bnch"), nullptr,
                                                      Kernel::FileStoreItemType::NotNestable,
                                                      Kernel::FileStoreItemType::NotRecoverable);
        return &s_type;
    }

private:
    ~BytesItem() override = default;
    std::string const& m_bytes;
};

} // namespace Bench
