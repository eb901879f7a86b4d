#include "libkernel/archive/internal/ArchiveFormat.h"

#include "libkernel/core/Endian.h"
#include "libkernel/core/Limits.h"

#include <cstring>

namespace Kernel::ArchiveFormat {

namespace {

/// Moves over a block of fields in the order in which they lie.
class FieldWriter
{
public:
    explicit FieldWriter(u8* at) : m_at(at) {}
    template <class T>
    FieldWriter& Put(T value)
    {
        StoreLittleEndian(m_at, value);
        m_at += sizeof(T);
        return *this;
    }

private:
    u8* m_at;
};

class FieldReader
{
public:
    explicit FieldReader(u8 const* at) : m_at(at) {}
    template <class T>
    T Get()
    {
        T const value = LoadLittleEndian<T>(m_at);
        m_at += sizeof(T);
        return value;
    }
    template <class T>
    FieldReader& Get(T& value)
    {
        value = Get<T>();
        return *this;
    }

private:
    u8 const* m_at;
};

void AppendBytes(std::vector<u8>& out, void const* data, u64 size)
{
    u8 const* const bytes = static_cast<u8 const*>(data);
    out.insert(out.end(), bytes, bytes + size);
}

template <class T>
void AppendNumber(std::vector<u8>& out, T value)
{
    u8 bytes[sizeof(T)];
    StoreLittleEndian(bytes, value);
    AppendBytes(out, bytes, sizeof(T));
}

} // namespace

u8 FromOldCode(u8 oldCode)
{
    static constexpr u8 c_codes[] = {0, 0x01, 0x41, 0x81, 0xC1};
    return oldCode < sizeof(c_codes) ? c_codes[oldCode] : 0;
}

bool SizesArePlausible(u8 code, u64 size, u64 storedSize)
{
    switch (MethodOf(code)) {
    case MethodDirect: return size == storedSize;
    case MethodZLib: return size <= c_codecSlack || (size - c_codecSlack) / c_maxZlibRatio <= storedSize;
    case MethodZStandard: return size <= c_codecSlack || (size - c_codecSlack) / c_maxZstdRatio <= storedSize;
    }
    return false;
}

void EncodeHeader(u8 (&out)[c_headerSize], Archive::ArchiveHdr const& header)
{
    FieldWriter(out).Put(c_magic).Put(header.fileVersion).Put(header.flags).Put(header.archiveUID.value);
}

bool DecodeHeader(u8 const (&in)[c_headerSize], Archive::ArchiveHdr& header)
{
    FieldReader fields(in);
    bool const ok = fields.Get<u32>() == c_magic;
    fields.Get(header.fileVersion).Get(header.flags).Get(header.archiveUID.value);
    return ok;
}

void EncodeInfo(u8 (&out)[c_infoSize], Archive::ArchiveInfo const& info)
{
    FieldWriter(out)
        .Put(c_tagInfo)
        .Put(info.firstFAT)
        .Put(info.fileEnd)
        .Put(info.totalBytes)
        .Put(info.deadBytes)
        .Put(info.saveTimeStamp.GetValue())
        .Put(info.saveCount)
        .Put(info.nextFreeUID);
}

bool DecodeInfo(u8 const (&in)[c_infoSize], Archive::ArchiveInfo& info)
{
    FieldReader fields(in);
    bool const ok = fields.Get<u32>() == c_tagInfo;
    fields.Get(info.firstFAT).Get(info.fileEnd).Get(info.totalBytes).Get(info.deadBytes);
    info.saveTimeStamp = TimeStamp(fields.Get<i64>());
    fields.Get(info.saveCount).Get(info.nextFreeUID);
    return ok;
}

void EncodeFATHeader(u8 (&out)[c_fatHeaderSize], FATHeader const& header)
{
    FieldWriter(out)
        .Put(c_tagFAT)
        .Put(header.nextFAT)
        .Put(header.timeStamp.GetValue())
        .Put(header.fileEnd)
        .Put(header.totalBytes)
        .Put(header.deadBytes)
        .Put(header.recordCount)
        .Put(header.userDataSize)
        .Put(header.bodySize)
        .Put(header.pathCountCount)
        .Put(header.revisionTag);
}

FATKind const* DecodeFATHeader(u8 const (&in)[c_fatHeaderSize], FATHeader& header, bool& newer)
{
    FieldReader fields(in);
    u32 const tag = fields.Get<u32>();
    fields.Get(header.nextFAT);
    header.timeStamp = TimeStamp(fields.Get<i64>());
    fields.Get(header.fileEnd).Get(header.totalBytes).Get(header.deadBytes);
    fields.Get(header.recordCount).Get(header.userDataSize).Get(header.bodySize);
    fields.Get(header.pathCountCount).Get(header.revisionTag);
    newer = std::memcmp(in, "#FT", 3) == 0 && in[3] >= '5' && in[3] <= '9';
    for (FATKind const& kind : c_fatKinds)
        if (kind.tag == tag) return &kind;
    return nullptr;
}

u64 RecordSize(Archive::FileRevision const& entry)
{
    if (entry.IsDeletion()) return c_recordFixedSize;
    u64 const path = entry.added ? 2 + static_cast<u64>(entry.info->GetPath().GetLength()) : 0;
    return c_recordFixedSize + c_detailsSize + path;
}

void AppendRecord(std::vector<u8>& out, Archive::FileRevision const& entry)
{
    u8 fixed[c_recordFixedSize + c_detailsSize];
    FieldWriter fields(fixed);
    fields.Put(entry.info->GetUID());
    if (entry.IsDeletion()) {
        fields.Put(static_cast<u8>(RecordDeleted));
        AppendBytes(out, fixed, c_recordFixedSize);
        return;
    }
    fields.Put(static_cast<u8>(entry.added ? RecordAdded : RecordChanged))
        .Put(entry.filePos)
        .Put(entry.fileSize)
        .Put(entry.fileCompressedSize)
        .Put(entry.crcUncompressed)
        .Put(entry.compressionCode)
        .Put(entry.codeBaseIndex)
        .Put(entry.crcCompressed);
    AppendBytes(out, fixed, sizeof(fixed));
    if (!entry.added) return;
    String8 const& path = entry.info->GetPath();
    AppendNumber(out, static_cast<u16>(path.GetLength()));
    AppendBytes(out, path.GetData(), static_cast<u64>(path.GetLength()));
}

void AppendPathCount(std::vector<u8>& out, String8 const& prefix, String8 const& suffix, u64 counter)
{
    AppendNumber(out, static_cast<u16>(prefix.GetLength()));
    AppendNumber(out, static_cast<u16>(suffix.GetLength()));
    AppendNumber(out, counter);
    AppendBytes(out, prefix.GetData(), static_cast<u64>(prefix.GetLength()));
    AppendBytes(out, suffix.GetData(), static_cast<u64>(suffix.GetLength()));
}

void DecodeDetails(u8 const* in, FATKind const& kind, Archive::FileRevision& entry)
{
    FieldReader fields(in);
    fields.Get(entry.filePos).Get(entry.fileSize).Get(entry.fileCompressedSize);
    fields.Get(entry.crcUncompressed).Get(entry.compressionCode);
    if (kind.oldCode) entry.compressionCode = FromOldCode(entry.compressionCode);
    if (kind.detailsSize >= 33) fields.Get(entry.codeBaseIndex);
    if (kind.detailsSize >= 37) fields.Get(entry.crcCompressed);
}

bool EncodeFresh(std::vector<u8>& out, FreshFile& fresh)
{
    u64 const linkSize = fresh.hasLink ? static_cast<u64>(fresh.linkPath.GetLength()) : 0;
    u64 const referenceSize = fresh.hasReference ? static_cast<u64>(fresh.referencePath.GetLength()) : 0;
    if (linkSize > c_maxPathSize || referenceSize > c_maxPathSize) return false;

    fresh.info.fileEnd = c_firstContentPos + (fresh.hasLink ? c_linkFixedSize + linkSize : 0) +
                         (fresh.hasReference ? c_referenceFixedSize + referenceSize : 0);
    u16 const flags = static_cast<u16>((fresh.hasLink ? c_flagLink : 0) | (fresh.hasReference ? c_flagReference : 0));

    out.clear();
    out.reserve(fresh.info.fileEnd);
    u8 header[c_headerSize];
    EncodeHeader(header, {c_version, flags, fresh.archiveUID});
    AppendBytes(out, header, sizeof(header));
    u8 info[c_infoSize];
    EncodeInfo(info, fresh.info);
    AppendBytes(out, info, sizeof(info));
    AppendNumber(out, c_tagGuard);
    AppendNumber(out, fresh.writeCounter);
    if (fresh.hasLink) {
        AppendNumber(out, fresh.linkSaveTimeStamp.GetValue());
        AppendNumber(out, fresh.linkSaveCount);
        AppendNumber(out, static_cast<u16>(linkSize));
        AppendBytes(out, fresh.linkPath.GetData(), linkSize);
    }
    if (fresh.hasReference) {
        AppendNumber(out, static_cast<u16>(referenceSize));
        AppendBytes(out, fresh.referencePath.GetData(), referenceSize);
    }
    return true;
}

} // namespace Kernel::ArchiveFormat
