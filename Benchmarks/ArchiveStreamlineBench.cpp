// Streamlining a document of 1,000 items whose 64 MiB of blocks are half dead, beside a raw copy of the live bytes with
// the same flushes, and beside SQLite's compact copy of the same items. Arguments: a folder on the device to measure
// (default: the current one), and the number of rounds.

#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/archive/ArchiveSession.h"
#include "libkernel/archive/ArchiveStreamline.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/filesystem/TempFile.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"
#include "support/BytesItem.h"
#include "support/Table.h"

#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <random>
#include <unistd.h>
#ifdef KERNEL_HAVE_SQLITE
#include <sqlite3.h>
#endif

namespace {

using namespace Kernel;
using Bench::BytesItem;

constexpr int c_items = 1000;
constexpr u64 c_itemSize = (u64{64} << 20) / (2 * c_items);

void Require(bool holds)
{
    if (holds) return;
    std::perror("benchmark");
    std::abort();
}

std::vector<std::string> MakeItems(unsigned seed)
{
    std::mt19937_64 random(seed);
    std::vector<std::string> items(c_items);
    for (std::string& item : items)
        while (item.size() < c_itemSize) {
            u64 const value = random();
            item.append(reinterpret_cast<char const*>(&value), sizeof(value));
        }
    return items;
}

std::string NameOf(int i)
{
    return "items/" + std::to_string(i);
}

/// Each round begins with a fresh document whose every item was saved twice.
Counted<Archive> MakeDocument(std::string const& path)
{
    Archive::CreateResult result;
    Counted<Archive> archive = Archive::Create(String8(path.c_str()), IDTag("Bnch"), result);
    Require(static_cast<bool>(archive));
    for (unsigned seed = 1; seed <= 2; ++seed) {
        std::vector<std::string> const items = MakeItems(seed);
        ArchiveSessionHandle handle;
        Require(archive->CreateSession(handle, Archive::SessionTypeRewrite, nullptr));
        for (int i = 0; i < c_items; ++i)
            handle->CreateFile(String8(NameOf(i).c_str()), MakeCounted<BytesItem>(items[static_cast<size_t>(i)]));
        archive->CloseSession(handle, false);
    }
    return archive;
}

void FlushFolder(std::string const& folder)
{
    int const handle = ::open(folder.c_str(), O_RDONLY);
    Require(handle >= 0 && ::fsync(handle) == 0);
    ::close(handle);
}

/// The floor: the live blocks go to a new file, in pieces of 1 MiB, and that goes over the old one, all on the device.
void CopyRaw(std::string const& folder, std::string const& path, bool overwrite)
{
    u64 const live = c_items * (c_itemSize + 8);
    std::string const temporary = path + ".raw";
    int const from = ::open(path.c_str(), O_RDWR);
    int const to = ::open(temporary.c_str(), O_RDWR | O_CREAT | O_TRUNC, 0600);
    Require(from >= 0 && to >= 0);
    static std::string buffer(1 << 20, 0);
    u64 const start = static_cast<u64>(::lseek(from, 0, SEEK_END)) - live;
    for (u64 at = 0; at < live;) {
        u64 const piece = std::min<u64>(buffer.size(), live - at);
        Require(::pread(from, buffer.data(), piece, static_cast<off_t>(start + at)) == static_cast<ssize_t>(piece));
        Require(::pwrite(to, buffer.data(), piece, static_cast<off_t>(at)) == static_cast<ssize_t>(piece));
        at += piece;
    }
    Require(::fsync(to) == 0);
    FlushFolder(folder);
    if (overwrite) {
        Require(::pwrite(from, buffer.data(), 12, 0) == 12 && ::fdatasync(from) == 0);
        for (u64 at = 0; at < live;) {
            u64 const piece = std::min<u64>(buffer.size(), live - at);
            Require(::pread(to, buffer.data(), piece, static_cast<off_t>(at)) == static_cast<ssize_t>(piece));
            Require(::pwrite(from, buffer.data(), piece, static_cast<off_t>(at)) == static_cast<ssize_t>(piece));
            at += piece;
        }
        Require(::ftruncate(from, static_cast<off_t>(live)) == 0 && ::fsync(from) == 0);
        Require(::pwrite(from, buffer.data(), 12, 0) == 12 && ::fdatasync(from) == 0);
        ::unlink(temporary.c_str());
    } else {
        std::string const backup = path + ".backup";
        Require(::rename(path.c_str(), backup.c_str()) == 0);
        FlushFolder(folder);
        Require(::fsync(to) == 0 && ::rename(temporary.c_str(), path.c_str()) == 0);
        FlushFolder(folder);
        ::unlink(backup.c_str());
    }
    ::close(from);
    ::close(to);
}

#ifdef KERNEL_HAVE_SQLITE
void Execute(sqlite3* database, std::string const& sql)
{
    Require(sqlite3_exec(database, sql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK);
}

/// Every item written twice, in two transactions; half of the pages are free then.
sqlite3* MakeDatabase(std::string const& path)
{
    sqlite3* database = nullptr;
    Require(sqlite3_open(path.c_str(), &database) == SQLITE_OK);
    Execute(database, "PRAGMA page_size=65536; PRAGMA synchronous=FULL;"
                      "CREATE TABLE items (name TEXT PRIMARY KEY, bytes BLOB)");
    for (unsigned seed = 1; seed <= 2; ++seed) {
        std::vector<std::string> const items = MakeItems(seed);
        Execute(database, "BEGIN");
        sqlite3_stmt* insert = nullptr;
        Require(sqlite3_prepare_v2(database, "INSERT INTO items VALUES (?, ?)", -1, &insert, nullptr) == SQLITE_OK);
        for (int i = 0; i < c_items; ++i) {
            std::string const name = NameOf(i) + (seed == 1 ? " old" : "");
            std::string const& bytes = items[static_cast<size_t>(i)];
            sqlite3_bind_text(insert, 1, name.c_str(), -1, SQLITE_TRANSIENT);
            sqlite3_bind_blob(insert, 2, bytes.data(), static_cast<int>(bytes.size()), SQLITE_STATIC);
            Require(sqlite3_step(insert) == SQLITE_DONE);
            sqlite3_reset(insert);
        }
        sqlite3_finalize(insert);
        Execute(database, "COMMIT");
    }
    Execute(database, "DELETE FROM items WHERE name LIKE '% old'");
    return database;
}
#endif

/// Median of the rounds' seconds; what a round begins with is not counted.
template <class TPrepare, class TWork>
double Measure(int rounds, TPrepare const& prepare, TWork const& work)
{
    std::vector<double> times;
    for (int i = 0; i < rounds; ++i) {
        auto state = prepare();
        ::sync();
        auto const start = std::chrono::steady_clock::now();
        work(state);
        times.push_back(std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
    }
    std::sort(times.begin(), times.end());
    return times[times.size() / 2];
}

} // namespace

int main(int argc, char** argv)
{
    std::string const folder = std::string(argc > 1 ? argv[1] : ".") + "/streamline-bench";
    int const rounds = argc > 2 ? std::atoi(argv[2]) : 5;
    std::filesystem::remove_all(folder);
    std::filesystem::create_directories(folder + "/temporaries");
    std::vector<String8> rescued;
    TempFile::SetTempPath(String8((folder + "/temporaries").c_str()), String8((folder + "/temporaries").c_str()),
                          rescued);
    std::string const path = folder + "/doc";
    auto const fresh = [&] {
        std::filesystem::remove(path);
        return MakeDocument(path);
    };
    auto const file = [&] {
        fresh();
        return 0;
    };
    using Document = Counted<Archive>;
    auto const streamline = [&](bool overwrite, bool verify) {
        return Measure(rounds, fresh, [&](Document& archive) {
            archive->SetAlwaysStreamlineOverwrite(overwrite);
            String8 report;
            Require((verify ? archive->StreamlineAndVerifyFileState(report, nullptr, nullptr, nullptr)
                            : archive->Streamline(nullptr, nullptr, nullptr)) == Archive::StreamlineDone);
        });
    };
    double const raw = Measure(rounds, file, [&](int) { CopyRaw(folder, path, false); });
    double const rawOver = Measure(rounds, file, [&](int) { CopyRaw(folder, path, true); });
    double const replaced = streamline(false, false);
    double const verified = streamline(false, true);
    double const overwritten = streamline(true, false);
    std::string const copy = folder + "/copy";
    double const toNew = Measure(rounds, fresh, [&](Document& archive) {
        Require(archive->StreamlineToNew(String8(copy.c_str())) == Archive::StreamlineDone);
    });
    Bench::Table table("Streamlining 1,000 items, 64 MiB, half dead");
    table.Row("replace by rename", "limit: raw copy, same flushes", raw * 1e3, "ms");
    table.Row("replace by rename", "libkernel", replaced * 1e3, "ms", raw * 1e3, "<= 1.2 x limit");
    table.Row("replace by rename, verified", "libkernel", verified * 1e3, "ms", raw * 1e3);
    table.Row("overwrite", "limit: raw copy, same flushes", rawOver * 1e3, "ms");
    table.Row("overwrite", "libkernel", overwritten * 1e3, "ms", rawOver * 1e3, "<= 1.2 x limit");
#ifdef KERNEL_HAVE_SQLITE
    std::string const base = folder + "/items.db";
    std::string const vacuumed = folder + "/vacuumed.db";
    double const vacuum = Measure(
        rounds,
        [&] {
            std::filesystem::remove(base);
            std::filesystem::remove(vacuumed);
            return MakeDatabase(base);
        },
        [&](sqlite3* database) {
            Execute(database, "VACUUM INTO '" + vacuumed + "'");
            int const handle = ::open(vacuumed.c_str(), O_RDONLY);
            Require(::fsync(handle) == 0);
            ::close(handle);
            FlushFolder(folder);
            sqlite3_close(database);
        });
    table.Row("compact copy", "sqlite VACUUM INTO, flushed", vacuum * 1e3, "ms");
    table.Row("compact copy", "libkernel", toNew * 1e3, "ms", vacuum * 1e3);
#else
    table.Row("compact copy", "libkernel", toNew * 1e3, "ms");
#endif
    std::filesystem::remove_all(folder);
    return 0;
}
