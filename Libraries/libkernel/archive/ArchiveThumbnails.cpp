#include "libkernel/archive/ArchiveThumbnails.h"

#include "libkernel/archive/internal/ArchiveAppender.h"
#include "libkernel/archive/internal/ArchiveReadGate.h"
#include "libkernel/archive/internal/ArchiveThumbnailBlock.h"
#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/Endian.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/OutSerialiser.h"
#include "libkernel/streams/FileIOException.h"

#include <algorithm>
#include <cstring>

namespace Kernel {

using namespace ArchiveFormat;

namespace {

constexpr IDTag c_tagRecs("recs");
constexpr IDTag c_tagType("type");
constexpr IDTag c_tagData("data");
constexpr u16 c_schemaVersion = 1;

EnumSerialiser const& GetFileTypes()
{
    static EnumSerialiser const s_types = [] {
        static constexpr EnumSerialiser::EnumEntry c_entries[] = {
            {static_cast<int>(ArchiveThumbnails::FileType::Picture), 0}};
        EnumSerialiser types;
        types.RegisterEnumSet(c_entries, 1);
        return types;
    }();
    return s_types;
}

Counted<Serialisable> CreateThumbnails()
{
    return MakeCounted<ArchiveThumbnails>();
}

ClassProperties const s_classProperties(ClassUID("arth"), CreateThumbnails, c_schemaVersion, nullptr, nullptr);
ClassPropertiesBase::Init const s_init(&s_classProperties);

} // namespace

ArchiveThumbnails::ArchiveThumbnails() = default;
ArchiveThumbnails::~ArchiveThumbnails() = default;

void ArchiveThumbnails::AddFile(FileType type, Counted<RawData> const& data)
{
    if (data) m_recs.push_back({type, data});
}

ClassProperties const* ArchiveThumbnails::GetObjectClassProperties() const
{
    return &s_classProperties;
}

void ArchiveThumbnails::Save(OutSerialiser& out) const
{
    out.SaveClasses(c_tagRecs, m_recs);
}

bool ArchiveThumbnails::Load(InSerialiser const& in, FileStore&, u16)
{
    return in.LoadClasses(c_tagRecs, m_recs);
}

void ArchiveThumbnails::Rec::Save(OutSerialiser& out) const
{
    out.SaveEnum(c_tagType, GetFileTypes(), type);
    out.SaveRawData(c_tagData, data ? data->GetData() : nullptr, data ? data->GetSize() : 0);
}

bool ArchiveThumbnails::Rec::Load(InSerialiser const& in, ClassUID const&, u16)
{
    RawDataBlock bytes;
    if (!in.LoadEnum(c_tagType, GetFileTypes(), type) || !in.LoadRawData(c_tagData, bytes, true)) return false;
    auto block = MakeCounted<RawData>(bytes.GetSize());
    if (bytes.GetSize() != 0) {
        if (!block->GetData()) return false;
        std::memcpy(block->GetData(), bytes.GetData(), bytes.GetSize());
    }
    data = std::move(block);
    return true;
}

namespace {

/// The block at @p position, or null if anything about it is wrong. Every entry must lie inside the block, and together
/// they may not claim more than it holds: many entries over one range would multiply it.
Counted<ArchiveThumbnails> ReadThumbnails(FileInOutStream& stream, u64 position)
{
    u8 header[c_thumbnailHeaderSize];
    if (stream.ReadAt(position, header, sizeof(header)) != sizeof(header)) return nullptr;
    if (LoadLittleEndian<u32>(header) != c_blockEnd || LoadLittleEndian<u32>(header + 4) != c_tagThumbnails)
        return nullptr;
    u64 const count = LoadLittleEndian<u32>(header + 8);
    u64 const rest = LoadLittleEndian<u32>(header + 12);
    u64 const fileSize = stream.GetSizeInStream();
    if (count * c_thumbnailEntrySize > rest || !RangeFits(position, c_thumbnailHeaderSize + rest, fileSize))
        return nullptr;

    std::vector<u8> entries(count * c_thumbnailEntrySize);
    if (stream.ReadAt(position + c_thumbnailHeaderSize, entries.data(), entries.size()) != entries.size())
        return nullptr;
    u64 const blockSize = c_thumbnailHeaderSize + rest;
    u64 left = rest - entries.size();
    auto thumbnails = MakeCounted<ArchiveThumbnails>();
    for (u64 i = 0; i < count; ++i) {
        u8 const* const entry = entries.data() + i * c_thumbnailEntrySize;
        u64 const offset = LoadLittleEndian<u64>(entry);
        u64 const size = LoadLittleEndian<u32>(entry + 8);
        if (!RangeFits(offset, size, blockSize) || size > left) return nullptr;
        left -= size;
        auto data = MakeCounted<RawData>(size);
        if (size != 0 && (!data->GetData() || stream.ReadAt(position + offset, data->GetData(), size) != size))
            return nullptr;
        thumbnails->AddFile(ArchiveThumbnails::FileType::Picture, data);
    }
    return thumbnails;
}

} // namespace

Counted<ArchiveThumbnails const> Archive::LoadThumbnails()
{
    ArchiveReadGate const gate(*m);
    Counted<ArchiveFile> file;
    {
        CriticalSectionScope const lock(m->m_stateLock);
        bool const inScratch = m->m_scratch && m->m_scratch->m_thumbnailsPos.load() != 0;
        file = inScratch ? m->m_scratch : m->m_master;
    }
    if (!file || file->m_thumbnailsPos.load() == 0) return nullptr;
    ArchiveAccessScope const access(*m);
    if (!access.IsOpen()) return nullptr;
    Counted<ArchiveThumbnails const> result;
    try {
        CriticalSectionScope const lock(file->m_lock);
        u64 const position = file->m_thumbnailsPos.load();
        result = file->m_thumbnails;
        if (!result && position != 0 && file->m_stream) {
            result = ReadThumbnails(*file->m_stream, position);
            file->m_thumbnails = result;
        }
    } catch (FileIOException const&) {
    }
    return result;
}

bool CopyThumbnails(OutStream& out, Archive::ArchiveFile& file, void* buffer, u64 size)
{
    CriticalSectionScope const lock(file.m_lock);
    u64 position = file.m_thumbnailsPos.load();
    if (position == 0 || !file.m_stream || size == 0) return false;
    try {
        u8 header[c_thumbnailHeaderSize];
        if (file.m_stream->ReadAt(position, header, sizeof(header)) != sizeof(header)) return false;
        if (LoadLittleEndian<u32>(header) != c_blockEnd || LoadLittleEndian<u32>(header + 4) != c_tagThumbnails)
            return false;
        if (out.WriteBlock(header, sizeof(header)) != sizeof(header)) return false;
        position += sizeof(header);
        for (u64 left = LoadLittleEndian<u32>(header + 12); left != 0;) {
            u64 const piece = std::min(left, size);
            if (file.m_stream->ReadAt(position, buffer, piece) != piece || out.WriteBlock(buffer, piece) != piece)
                return false;
            position += piece;
            left -= piece;
        }
        return true;
    } catch (Exception const&) {
        // Thumbnails are not worth a failed save.
        return false;
    }
}

} // namespace Kernel
