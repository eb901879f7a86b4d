#pragma once

#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/Types.h"

#include <string>
#include <vector>

// The bytes of an archive file: every number that the readers and the writers share. All integers are little-endian,
// strings are UTF-8 behind their length, and there is no padding anywhere.
//
//   offset  size    what
//        0    12    header
//       12    52    info block: the one record that a commit rewrites
//       64     8    write guard block, from version 8 on
//       72    14+n  link to the master, if flag bit 0 is set
//              2+n  reference path, if flag bit 1 is set
//                   file blocks and tables (FATs), in the order written, up to FileEnd
//  FileEnd          thumbnail block, if there is one

namespace Kernel::ArchiveFormat {

// Header.
//   0  4  magic: the bytes 00 FF 4B 41
//   4  2  version
//   6  2  flags
//   8  4  kind of document
constexpr u32 c_magic = 0x414BFF00;
constexpr u16 c_oldestVersion = 7;
constexpr u16 c_guardVersion = 8; ///< First version with a write guard block.
constexpr u16 c_version = 11;
constexpr u64 c_headerPos = 0;
constexpr u64 c_headerSize = 12;

constexpr u16 c_flagLink = 1;
constexpr u16 c_flagReference = 2;
constexpr u16 c_flagMidStreamline = 4;
constexpr u16 c_flagStreamlined = 8;

// Info block.
//   0  4  tag "#Inf"
//   4  8  FirstFAT: position of the newest table, 0 for none
//  12  8  FileEnd: first byte after the newest table
//  20  8  TotalBytes: stored bytes of all blocks of this history
//  28  8  DeadBytes: the part of them that no head revision reaches
//  36  8  SaveTimeStamp
//  44  4  SaveCount
//  48  4  NextFreeUID
constexpr u64 c_infoPos = 12;
constexpr u64 c_infoSize = 52;

// Write guard block: tag "Prot", then the write counter.
constexpr u64 c_guardPos = 64;
constexpr u64 c_guardSize = 8;

// Link: the master's SaveTimeStamp (8) and SaveCount (4), then the path behind its length of 2 bytes.
constexpr u64 c_linkFixedSize = 14;
constexpr u64 c_referenceFixedSize = 2;
constexpr u64 c_maxPathSize = 0xFFFF;

constexpr u64 c_firstContentPos = c_guardPos + c_guardSize; // No link, no reference path.
constexpr u64 c_firstContentPosV7 = c_guardPos;

// File block: tag "#Fil", the stored bytes, four bytes FF.
constexpr u64 c_blockTagSize = 4;
constexpr u64 c_blockEndSize = 4;
constexpr u32 c_blockEnd = 0xFFFFFFFF;
constexpr u64 c_noBlockPos = u64{1} << 62; ///< In memory only, as those above it: no block can lie there.

// Table (FAT).
//   0  4  tag
//   4  8  NextFAT: position of the previous table, 0 for the first
//  12  8  time stamp
//  20  8  FileEnd after this revision
//  28  8  TotalBytes
//  36  8  DeadBytes
//  44  4  number of file records
//  48  4  size of the user data
//  52  4  size of the body
//  56  2  number of path count records
//  58  1  revision tag
// Body: file records, path count records, user data.
constexpr u64 c_fatHeaderSize = 59;

// File record: UID (4), kind (1); kinds 0 and 1: details; kind 0: path behind its length of 2 bytes.
constexpr u64 c_recordFixedSize = 5;
constexpr u64 c_detailsSize = 37; ///< As written today; older tables have 29 or 33.
enum RecordKind : u8
{
    RecordAdded = 0,
    RecordChanged = 1,
    RecordDeleted = 2
};

// Path count record: length of prefix (2) and of suffix (2), counter (8), the prefix, the suffix.
constexpr u64 c_pathCountFixedSize = 12;

// Thumbnail block: FF FF FF FF, tag "Thmb", count (4), size of entries and data (4); entries of 13 bytes: offset from
// the start of the block (8), size (4), type (1).
constexpr u64 c_thumbnailHeaderSize = 16;
constexpr u64 c_thumbnailEntrySize = 13;
constexpr u8 c_thumbnailType = 1;

// Tags are stored as four characters in reading order.
constexpr u32 TagBytes(char const (&t)[5])
{
    return static_cast<u32>(static_cast<u8>(t[0])) | static_cast<u32>(static_cast<u8>(t[1])) << 8 |
           static_cast<u32>(static_cast<u8>(t[2])) << 16 | static_cast<u32>(static_cast<u8>(t[3])) << 24;
}
constexpr u32 c_tagInfo = TagBytes("#Inf");
constexpr u32 c_tagGuard = TagBytes("Prot");
constexpr u32 c_tagBlock = TagBytes("#Fil");
constexpr u32 c_tagFAT = TagBytes("#FT4");
constexpr u32 c_tagThumbnails = TagBytes("Thmb");

/// What differs between the tables of the versions.
struct FATKind
{
    u32 tag;
    u64 detailsSize;
    bool oldCode; ///< The compression code is of the old kind.
};
inline constexpr FATKind c_fatKinds[] = {
    {TagBytes("#FAT"), 29, true}, {TagBytes("#FT2"), 33, true}, {TagBytes("#FT3"), 33, false}, {c_tagFAT, 37, false}};

// Compression code: bits 0 to 1 method, bit 5 striping, bits 6 to 7 predictor.
enum Method : u8
{
    MethodDirect = 0,
    MethodZLib = 1,
    MethodZStandard = 2
};
/// The method; the unused value 3 reads as direct.
constexpr Method MethodOf(u8 code)
{
    return (code & 3) == 3 ? MethodDirect : static_cast<Method>(code & 3);
}
constexpr int PredictorOf(u8 code)
{
    return code >> 6;
}
/// Striping counts only with predictors 2 and 3.
constexpr int StripingOf(u8 code)
{
    return PredictorOf(code) >= 2 && (code & 0x20) ? 1 : 0;
}
constexpr u8 MakeCode(Method method, int predictor, int striping)
{
    return static_cast<u8>(method | (striping && predictor >= 2 ? 0x20 : 0) | (predictor << 6));
}
/// The code of a table older than "#FT3".
u8 FromOldCode(u8 oldCode);

/// True if the codec can give @p size bytes from @p storedSize: what cannot be so is not worth memory.
bool SizesArePlausible(u8 code, u64 size, u64 storedSize);

// Encoders append to or fill a byte block; decoders expect the fixed size given above.
void EncodeHeader(u8 (&out)[c_headerSize], Archive::ArchiveHdr const& header);
/// False if the magic is wrong.
bool DecodeHeader(u8 const (&in)[c_headerSize], Archive::ArchiveHdr& header);
void EncodeInfo(u8 (&out)[c_infoSize], Archive::ArchiveInfo const& info);
/// False if the tag is wrong.
bool DecodeInfo(u8 const (&in)[c_infoSize], Archive::ArchiveInfo& info);

struct FATHeader
{
    u64 nextFAT = 0;
    TimeStamp timeStamp;
    u64 fileEnd = 0;
    u64 totalBytes = 0;
    u64 deadBytes = 0;
    u32 recordCount = 0;
    u32 userDataSize = 0;
    u32 bodySize = 0;
    u16 pathCountCount = 0;
    u8 revisionTag = 0;
};
void EncodeFATHeader(u8 (&out)[c_fatHeaderSize], FATHeader const& header);
/// The kind by its tag, null when the tag is not that of a table we read; @p newer then tells "#FT5" to "#FT9" apart.
FATKind const* DecodeFATHeader(u8 const (&in)[c_fatHeaderSize], FATHeader& header, bool& newer);

/// The fixed part and the details of one record; the path follows it for kind 0.
void AppendRecord(std::vector<u8>& out, Archive::FileRevision const& entry);
u64 RecordSize(Archive::FileRevision const& entry);
void AppendPathCount(std::vector<u8>& out, String8 const& prefix, String8 const& suffix, u64 counter);
/// Decodes @p kind.detailsSize bytes; what an older table lacks stays 0.
void DecodeDetails(u8 const* in, FATKind const& kind, Archive::FileRevision& entry);

/// Everything from offset 0 to the first block of a fresh file: header, info, guard, link and reference path.
struct FreshFile
{
    IDTag archiveUID;
    Archive::ArchiveInfo info; // fileEnd is filled in by EncodeFresh.
    u32 writeCounter = 1;
    bool hasLink = false;
    TimeStamp linkSaveTimeStamp;
    u32 linkSaveCount = 0;
    String8 linkPath;
    bool hasReference = false;
    String8 referencePath;
};
/// False if a path has 65,536 bytes or more. @p fresh.info.fileEnd becomes the size of @p out.
bool EncodeFresh(std::vector<u8>& out, FreshFile& fresh);

} // namespace Kernel::ArchiveFormat
