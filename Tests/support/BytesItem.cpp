#include "support/BytesItem.h"

#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

namespace KernelTest {

using namespace Kernel;

namespace {

Counted<FileStoreItem> CreateBytesItem()
{
    return MakeCounted<BytesItem>();
}

FileStoreItemType::Init const s_init(BytesItem::c_type);

} // namespace

FileStoreItemType const BytesItem::c_type(ClassUID("Byts"), CreateBytesItem, FileStoreItemType::NotNestable,
                                          FileStoreItemType::NotRecoverable);

BytesItem::~BytesItem() = default;

void BytesItem::Save(OutStream& stream, FileStoreOut& out) const
{
    if (onSave) onSave(out);
    if (stream.WriteBlock(bytes.data(), bytes.size()) != bytes.size()) throw OutStream::WriteException();
}

bool BytesItem::Load(InStream& stream, FileStore&)
{
    bytes.resize(stream.GetSize());
    return stream.ReadBlock(bytes.data(), bytes.size()) == bytes.size();
}

Counted<FileStoreCompressionHint> Compressed()
{
    return MakeCounted<FileStoreCompressionHintGeneral>();
}

} // namespace KernelTest
