#include "support/ArchiveBuilder.h"

#include "support/CompressionFixture.h"

#include <algorithm>
#include <zlib.h>

namespace TestSupport {

using namespace Kernel;

std::string Little(u64 value, int size)
{
    std::string bytes;
    for (int i = 0; i < size; ++i) bytes += static_cast<char>(value >> (8 * i));
    return bytes;
}

namespace {

u32 Crc(std::string const& bytes)
{
    return static_cast<u32>(crc32(0, reinterpret_cast<Bytef const*>(bytes.data()), static_cast<uInt>(bytes.size())));
}

// The oldest tables know zlib alone, with the predictor counted from 1.
u8 OldCode(u8 code)
{
    return (code & 3) == 1 ? static_cast<u8>(1 + (code >> 6)) : 0;
}

std::string Encode(ArchiveBuilder::Record const& record, std::string const& tag)
{
    std::string out = Little(record.uid, 4) + Little(record.kind, 1);
    if (record.kind == 2) return out;
    ArchiveBuilder::Details const& d = record.details;
    bool const old = tag == "#FAT" || tag == "#FT2";
    out += Little(d.pos, 8) + Little(d.size, 8) + Little(d.stored, 8) + Little(d.crc, 4);
    out += Little(d.rawCode.value_or(old ? OldCode(d.code) : d.code), 1);
    if (tag != "#FAT") out += Little(d.build, 4);
    if (tag != "#FAT" && tag != "#FT2" && tag != "#FT3") out += Little(d.storedCrc, 4);
    if (record.kind == 0) out += Little(record.path.size(), 2) + record.path;
    return out;
}

} // namespace

u64 ArchiveBuilder::GetFrontSize() const
{
    return 64 + (version >= 8 ? 8 : 0) + (link ? 14 + link->path.size() : 0) + (reference ? 2 + reference->size() : 0);
}

ArchiveBuilder::Details ArchiveBuilder::AddBlock(std::string const& bytes, u8 code)
{
    std::string stored = bytes;
    if ((code & 3) == 1 || (code & 3) == 2) {
        Kernel::Testing::Bytes const plain = Kernel::Testing::TransformSlowly(
            Kernel::Testing::Bytes(bytes.begin(), bytes.end()), code >> 6, (code & 0x20) != 0);
        Kernel::Testing::Bytes const packed = Kernel::Testing::PeerCompress((code & 3) == 2, plain);
        stored.assign(packed.begin(), packed.end());
    }
    Details details;
    details.pos = GetEnd();
    details.size = bytes.size();
    details.stored = stored.size();
    details.crc = Crc(bytes);
    details.code = code;
    details.storedCrc = std::max(Crc(stored), 1u);
    m_content += "#Fil" + stored + "\xFF\xFF\xFF\xFF";
    totalBytes += stored.size();
    return details;
}

u64 ArchiveBuilder::AddTable(Table const& table)
{
    std::string body;
    for (Record const& record : table.records) {
        body += Encode(record, table.tag);
        m_highestUID = std::max(m_highestUID, record.uid);
    }
    for (PathCount const& count : table.pathCounts)
        body += Little(count.prefix.size(), 2) + Little(count.suffix.size(), 2) + Little(count.counter, 8) +
                count.prefix + count.suffix;
    body += table.userData;
    u64 const position = GetEnd();
    m_content += table.tag + Little(table.next.value_or(m_newest), 8) + Little(static_cast<u64>(table.time), 8) +
                 Little(table.fileEnd.value_or(position + 59 + body.size()), 8) + Little(totalBytes, 8) +
                 Little(deadBytes, 8) + Little(table.recordCount.value_or(table.records.size()), 4) +
                 Little(table.userDataSize.value_or(table.userData.size()), 4) +
                 Little(table.bodySize.value_or(body.size()), 4) +
                 Little(table.pathCountCount.value_or(table.pathCounts.size()), 2) + Little(table.revisionTag, 1) +
                 body;
    m_newest = position;
    saveTime = table.time;
    ++saveCount;
    return position;
}

u64 ArchiveBuilder::AddFile(u32 uid, std::string const& path, std::string const& bytes, u8 code)
{
    Details const details = AddBlock(bytes, code);
    Table table;
    table.records = {{uid, 0, path, details}};
    return AddTable(table);
}

void ArchiveBuilder::AddThumbnails(std::vector<Thumbnail> const& entries, std::string const& data,
                                   std::optional<u32> count, std::optional<u32> size)
{
    std::string rest;
    for (Thumbnail const& entry : entries) rest += Little(entry.offset, 8) + Little(entry.size, 4) + Little(1, 1);
    rest += data;
    m_thumbnails = "\xFF\xFF\xFF\xFFThmb" + Little(count.value_or(entries.size()), 4) +
                   Little(size.value_or(rest.size()), 4) + rest;
}

std::string ArchiveBuilder::Build() const
{
    u16 const flags = static_cast<u16>((link ? 1 : 0) | (reference ? 2 : 0));
    std::string file = std::string("\x00\xFF\x4B\x41", 4) + Little(version, 2) + Little(flags, 2) + "ucoD";
    file += infoTag + Little(firstFAT.value_or(m_newest), 8) + Little(fileEnd.value_or(GetEnd()), 8) +
            Little(totalBytes, 8) + Little(deadBytes, 8) + Little(static_cast<u64>(saveTime), 8) +
            Little(saveCount, 4) + Little(nextFreeUID.value_or(m_highestUID + 1), 4);
    if (version >= 8) file += guardTag + Little(writeCounter, 4);
    if (link)
        file += Little(static_cast<u64>(link->time), 8) + Little(link->saveCount, 4) + Little(link->path.size(), 2) +
                link->path;
    if (reference) file += Little(reference->size(), 2) + *reference;
    return file + m_content + m_thumbnails;
}

} // namespace TestSupport
