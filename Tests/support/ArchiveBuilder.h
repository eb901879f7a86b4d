#pragma once

#include "libkernel/core/Types.h"

#include <optional>
#include <string>
#include <vector>

namespace TestSupport {

using Kernel::i64;
using Kernel::u16;
using Kernel::u32;
using Kernel::u64;
using Kernel::u8;

/// Writes archive files byte by byte from the layout alone, with nothing of the library's own encoder: any version and
/// kind of table, and any field wrong. What is not set is filled in as a sound file has it. The public members up to
/// the tables must be set before the first block or table is added.
class ArchiveBuilder
{
public:
    struct Details
    {
        u64 pos = 0;
        u64 size = 0;
        u64 stored = 0;
        u32 crc = 0;
        u8 code = 0; ///< In today's form; Table writes the old form where its tag asks for it.
        u32 build = 24;
        u32 storedCrc = 0;
        std::optional<u8> rawCode = {}; ///< Written as it is, instead of code.
    };
    struct Record
    {
        u32 uid = 0;
        u8 kind = 0; ///< 0 added, 1 changed, 2 deleted.
        std::string path = {};
        Details details = {};
    };
    struct PathCount
    {
        std::string prefix;
        std::string suffix;
        u64 counter = 0;
    };
    struct Table
    {
        std::string tag = "#FT4";
        std::vector<Record> records = {};
        std::vector<PathCount> pathCounts = {};
        std::string userData = {};
        u8 revisionTag = 0;
        i64 time = 1'500'000'000;
        std::optional<u64> next = {};
        std::optional<u64> fileEnd = {};
        std::optional<u32> recordCount = {};
        std::optional<u32> userDataSize = {};
        std::optional<u32> bodySize = {};
        std::optional<u16> pathCountCount = {};
    };
    struct Link
    {
        i64 time = 0;
        u32 saveCount = 0;
        std::string path = {};
    };
    struct Thumbnail
    {
        u64 offset = 0;
        u32 size = 0;
    };

    explicit ArchiveBuilder(u16 fileVersion = 11) : version(fileVersion) {}

    u16 version;
    std::optional<Link> link;
    std::optional<std::string> reference;

    std::string guardTag = "Prot";
    std::string infoTag = "#Inf";
    u32 writeCounter = 1;
    std::optional<u64> firstFAT;
    std::optional<u64> fileEnd;
    std::optional<u32> nextFreeUID;
    u64 totalBytes = 0; ///< AddBlock counts it up.
    u64 deadBytes = 0;
    i64 saveTime = 1'500'000'000;
    u32 saveCount = 1; ///< AddTable counts it up.

    /// Where the first block lies.
    u64 GetFrontSize() const;
    /// Where the next block or table will lie.
    u64 GetEnd() const { return GetFrontSize() + m_content.size(); }
    /// Appends a block that holds @p bytes packed as the code says: zlib, zstd and predictors by their definitions.
    Details AddBlock(std::string const& bytes, u8 code = 0);
    /// Appends a table that names the one before it; gives its position.
    u64 AddTable(Table const& table);
    /// One file, one table.
    u64 AddFile(u32 uid, std::string const& path, std::string const& bytes, u8 code = 0);
    /// Any bytes at all.
    void AddRaw(std::string const& bytes) { m_content += bytes; }
    /// The file, with a thumbnail block behind it if AddThumbnails was called.
    std::string Build() const;
    void AddThumbnails(std::vector<Thumbnail> const& entries, std::string const& data, std::optional<u32> count = {},
                       std::optional<u32> size = {});

private:
    std::string m_content;
    std::string m_thumbnails;
    u64 m_newest = 0;
    u32 m_highestUID = 0;
};

/// @p value in @p size bytes, least significant first.
std::string Little(u64 value, int size);

} // namespace TestSupport
