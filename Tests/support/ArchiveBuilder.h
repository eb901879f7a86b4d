#pragma once

#include "libkernel/core/Types.h"

#include <optional>
#include <string>
#include <vector>

namespace TestSupport {

/// Writes archive files byte by byte from the layout alone, with nothing of the library's own encoder: any version and
/// kind of table, and any field wrong. What is not set is filled in as a sound file has it. The public members up to
/// the tables must be set before the first block or table is added.
class ArchiveBuilder
{
public:
    struct Details
    {
        Kernel::u64 pos = 0;
        Kernel::u64 size = 0;
        Kernel::u64 stored = 0;
        Kernel::u32 crc = 0;
        Kernel::u8 code = 0; ///< In today's form; Table writes the old form where its tag asks for it.
        Kernel::u32 build = 24;
        Kernel::u32 storedCrc = 0;
        std::optional<Kernel::u8> rawCode = {}; ///< Written as it is, instead of code.
    };
    struct Record
    {
        Kernel::u32 uid = 0;
        Kernel::u8 kind = 0; ///< 0 added, 1 changed, 2 deleted.
        std::string path = {};
        Details details = {};
    };
    struct PathCount
    {
        std::string prefix;
        std::string suffix;
        Kernel::u64 counter = 0;
    };
    struct Table
    {
        std::string tag = "#FT4";
        std::vector<Record> records = {};
        std::vector<PathCount> pathCounts = {};
        std::string userData = {};
        Kernel::u8 revisionTag = 0;
        Kernel::i64 time = 1'500'000'000;
        std::optional<Kernel::u64> next = {};
        std::optional<Kernel::u64> fileEnd = {};
        std::optional<Kernel::u32> recordCount = {};
        std::optional<Kernel::u32> userDataSize = {};
        std::optional<Kernel::u32> bodySize = {};
        std::optional<Kernel::u16> pathCountCount = {};
    };
    struct Link
    {
        Kernel::i64 time = 0;
        Kernel::u32 saveCount = 0;
        std::string path = {};
    };
    struct Thumbnail
    {
        Kernel::u64 offset = 0;
        Kernel::u32 size = 0;
    };

    explicit ArchiveBuilder(Kernel::u16 fileVersion = 11) : version(fileVersion) {}

    Kernel::u16 version;
    std::optional<Link> link;
    std::optional<std::string> reference;

    std::string guardTag = "Prot";
    std::string infoTag = "#Inf";
    Kernel::u32 writeCounter = 1;
    std::optional<Kernel::u64> firstFAT;
    std::optional<Kernel::u64> fileEnd;
    std::optional<Kernel::u32> nextFreeUID;
    Kernel::u64 totalBytes = 0; ///< AddBlock counts it up.
    Kernel::u64 deadBytes = 0;
    Kernel::i64 saveTime = 1'500'000'000;
    Kernel::u32 saveCount = 1; ///< AddTable counts it up.

    /// Where the first block lies.
    Kernel::u64 GetFrontSize() const;
    /// Where the next block or table will lie.
    Kernel::u64 GetEnd() const { return GetFrontSize() + m_content.size(); }
    /// Appends a block that holds @p bytes packed as the code says: zlib, zstd and predictors by their definitions.
    Details AddBlock(std::string const& bytes, Kernel::u8 code = 0);
    /// Appends a table that names the one before it; gives its position.
    Kernel::u64 AddTable(Table const& table);
    /// One file, one table.
    Kernel::u64 AddFile(Kernel::u32 uid, std::string const& path, std::string const& bytes, Kernel::u8 code = 0);
    /// Any bytes at all.
    void AddRaw(std::string const& bytes) { m_content += bytes; }
    /// The file, with a thumbnail block behind it if AddThumbnails was called.
    std::string Build() const;
    void AddThumbnails(std::vector<Thumbnail> const& entries, std::string const& data,
                       std::optional<Kernel::u32> count = {}, std::optional<Kernel::u32> size = {});

private:
    std::string m_content;
    std::string m_thumbnails;
    Kernel::u64 m_newest = 0;
    Kernel::u32 m_highestUID = 0;
};

/// @p value in @p size bytes, least significant first.
std::string Little(Kernel::u64 value, int size);

} // namespace TestSupport
