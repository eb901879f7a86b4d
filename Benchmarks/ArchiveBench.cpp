// Saving, changing and reading documents (W1 to W3), beside stores that a user would pick instead and the limit of the
// machine. Arguments: a folder on the device to measure (default: the current one), and the number of rounds.

#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveSession.h"
#include "libkernel/filestore/FileStoreCompressionHint.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/streams/CRC32.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"
#include "support/BytesItem.h"
#include "support/Table.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <memory>
#include <random>
#include <unistd.h>
#include <zstd.h>
#ifdef KERNEL_HAVE_LMDB
#include <lmdb.h>
#endif
#ifdef KERNEL_HAVE_SQLITE
#include <sqlite3.h>
#endif

namespace {

using namespace Kernel;
using Bench::BytesItem;

struct Item
{
    std::string name;
    std::string bytes;
};

/// Text like records, noisy 16-bit pixels and random bytes, a third each: about 64 MB that pack to about 46 MB.
std::vector<Item> MakeItems(int count, u64 smallest, u64 largest)
{
    std::mt19937 random(42);
    std::vector<Item> items;
    for (int i = 0; i < count; ++i) {
        Item item;
        item.name = "items/" + std::to_string(i / 100) + "/item" + std::to_string(i);
        u64 const size = smallest + random() % (largest - smallest + 1);
        item.bytes.reserve(size + 64);
        switch (i % 3) {
        case 0:
            while (item.bytes.size() < size) {
                char line[96];
                std::snprintf(line, sizeof(line), "record %u; width=%u; height=%u; name=object%u\n",
                              static_cast<unsigned>(random() % 10000), static_cast<unsigned>(random() % 1000),
                              static_cast<unsigned>(random() % 1000), static_cast<unsigned>(random() % 500));
                item.bytes += line;
            }
            break;
        case 1: {
            unsigned value = 30000;
            while (item.bytes.size() < size) {
                value += random() % 65 - 32;
                item.bytes += static_cast<char>(value);
                item.bytes += static_cast<char>(value >> 8);
            }
            break;
        }
        default:
            while (item.bytes.size() < size) item.bytes += static_cast<char>(random());
            break;
        }
        item.bytes.resize(size);
        items.push_back(std::move(item));
    }
    return items;
}

/// What every store can do. A commit is on the device when Commit returns.
class Store
{
public:
    virtual ~Store() = default;
    virtual void Create(std::string const& path) = 0;
    virtual void Open(std::string const& path) = 0;
    virtual size_t List() = 0;
    virtual void Begin() = 0;
    virtual void Put(Item const& item) = 0;
    virtual void Commit() = 0;
    virtual size_t Read(std::string const& name) = 0;
    virtual void Close() = 0;
};

class KernelStore : public Store
{
public:
    explicit KernelStore(bool compress)
    {
        if (compress) m_hint = MakeCounted<FileStoreCompressionHintGeneral>();
    }
    void Create(std::string const& path) override
    {
        Archive::CreateResult result;
        m_archive = Archive::Create(String8(path.c_str()), IDTag("Bnch"), result);
    }
    void Open(std::string const& path) override
    {
        Archive::OpenResult result{};
        m_archive = Archive::Open(String8(path.c_str()), Archive::OpenModeReadWrite, IDTag("Bnch"), result);
    }
    size_t List() override
    {
        std::vector<String8> paths;
        m_archive->GetFileList(paths);
        return paths.size();
    }
    void Begin() override
    {
        m_session = std::make_unique<ArchiveSessionHandle>();
        if (!m_archive->CreateSession(*m_session, Archive::SessionTypeRewrite, nullptr)) std::abort();
    }
    void Put(Item const& item) override
    {
        (*m_session)->CreateFile(String8(item.name.c_str()), MakeCounted<BytesItem>(item.bytes), m_hint);
    }
    void Commit() override { m_archive->CloseSession(*m_session, false); }
    size_t Read(std::string const& name) override
    {
        RawDataBlock data;
        if (!m_archive->ReadFile(String8(name.c_str()), data)) std::abort();
        return data.GetSize();
    }
    void Close() override { m_archive = nullptr; }

private:
    Counted<FileStoreCompressionHint> m_hint;
    Counted<Archive> m_archive;
    std::unique_ptr<ArchiveSessionHandle> m_session;
};

/// Packs with one context, as the peers' users would.
class Packer
{
public:
    std::string_view Pack(std::string const& bytes)
    {
        m_buffer.resize(ZSTD_compressBound(bytes.size()));
        size_t const size =
            ZSTD_compressCCtx(m_out.get(), m_buffer.data(), m_buffer.size(), bytes.data(), bytes.size(), 3);
        return {m_buffer.data(), size};
    }
    size_t Unpack(void const* data, size_t size)
    {
        m_buffer.resize(ZSTD_getFrameContentSize(data, size));
        return ZSTD_decompressDCtx(m_in.get(), m_buffer.data(), m_buffer.size(), data, size);
    }

private:
    std::unique_ptr<ZSTD_CCtx, size_t (*)(ZSTD_CCtx*)> m_out{ZSTD_createCCtx(), ZSTD_freeCCtx};
    std::unique_ptr<ZSTD_DCtx, size_t (*)(ZSTD_DCtx*)> m_in{ZSTD_createDCtx(), ZSTD_freeDCtx};
    std::string m_buffer;
};

#ifdef KERNEL_HAVE_LMDB
class LmdbStore : public Store
{
public:
    explicit LmdbStore(bool compress) : m_compress(compress) {}
    void Create(std::string const& path) override { Open(path); }
    void Open(std::string const& path) override
    {
        mdb_env_create(&m_env);
        mdb_env_set_mapsize(m_env, size_t{8} << 30);
        if (mdb_env_open(m_env, path.c_str(), MDB_NOSUBDIR, 0644) != 0) std::abort();
        MDB_txn* txn = nullptr;
        mdb_txn_begin(m_env, nullptr, 0, &txn);
        mdb_dbi_open(txn, nullptr, MDB_CREATE, &m_dbi);
        mdb_txn_commit(txn);
    }
    size_t List() override
    {
        Read([&](MDB_txn* txn) {
            MDB_cursor* cursor = nullptr;
            mdb_cursor_open(txn, m_dbi, &cursor);
            MDB_val key, value;
            m_count = 0;
            while (mdb_cursor_get(cursor, &key, &value, MDB_NEXT) == 0) {
                Bench::Keep(std::string(static_cast<char*>(key.mv_data), key.mv_size));
                ++m_count;
            }
            mdb_cursor_close(cursor);
        });
        return m_count;
    }
    void Begin() override { mdb_txn_begin(m_env, nullptr, 0, &m_txn); }
    void Put(Item const& item) override
    {
        std::string_view const bytes = m_compress ? m_packer.Pack(item.bytes) : std::string_view(item.bytes);
        MDB_val key{item.name.size(), const_cast<char*>(item.name.data())};
        MDB_val value{bytes.size(), const_cast<char*>(bytes.data())};
        if (mdb_put(m_txn, m_dbi, &key, &value, 0) != 0) std::abort();
    }
    void Commit() override
    {
        if (mdb_txn_commit(m_txn) != 0) std::abort();
    }
    size_t Read(std::string const& name) override
    {
        size_t size = 0;
        Read([&](MDB_txn* txn) {
            MDB_val key{name.size(), const_cast<char*>(name.data())};
            MDB_val value;
            if (mdb_get(txn, m_dbi, &key, &value) != 0) std::abort();
            if (m_compress)
                size = m_packer.Unpack(value.mv_data, value.mv_size);
            else {
                m_copy.assign(static_cast<char*>(value.mv_data), value.mv_size);
                size = m_copy.size();
            }
        });
        return size;
    }
    void Close() override { mdb_env_close(m_env); }

private:
    template <class F>
    void Read(F&& work)
    {
        MDB_txn* txn = nullptr;
        mdb_txn_begin(m_env, nullptr, MDB_RDONLY, &txn);
        work(txn);
        mdb_txn_abort(txn);
    }
    bool const m_compress;
    Packer m_packer;
    std::string m_copy;
    size_t m_count = 0;
    MDB_env* m_env = nullptr;
    MDB_dbi m_dbi = 0;
    MDB_txn* m_txn = nullptr;
};
#endif

#ifdef KERNEL_HAVE_SQLITE
class SqliteStore : public Store
{
public:
    explicit SqliteStore(bool compress) : m_compress(compress) {}
    void Create(std::string const& path) override { Open(path); }
    void Open(std::string const& path) override
    {
        if (sqlite3_open(path.c_str(), &m_db) != SQLITE_OK) std::abort();
        Run("PRAGMA journal_mode=WAL");
        Run("PRAGMA synchronous=FULL");
        Run("CREATE TABLE IF NOT EXISTS items(name TEXT PRIMARY KEY, bytes BLOB) WITHOUT ROWID");
        sqlite3_prepare_v2(m_db, "INSERT OR REPLACE INTO items VALUES(?,?)", -1, &m_put, nullptr);
        sqlite3_prepare_v2(m_db, "SELECT bytes FROM items WHERE name=?", -1, &m_get, nullptr);
    }
    size_t List() override
    {
        sqlite3_stmt* list = nullptr;
        sqlite3_prepare_v2(m_db, "SELECT name FROM items", -1, &list, nullptr);
        size_t count = 0;
        while (sqlite3_step(list) == SQLITE_ROW) {
            Bench::Keep(std::string(reinterpret_cast<char const*>(sqlite3_column_text(list, 0))));
            ++count;
        }
        sqlite3_finalize(list);
        return count;
    }
    void Begin() override { Run("BEGIN"); }
    void Put(Item const& item) override
    {
        std::string_view const bytes = m_compress ? m_packer.Pack(item.bytes) : std::string_view(item.bytes);
        sqlite3_bind_text(m_put, 1, item.name.data(), static_cast<int>(item.name.size()), SQLITE_STATIC);
        sqlite3_bind_blob(m_put, 2, bytes.data(), static_cast<int>(bytes.size()), SQLITE_STATIC);
        if (sqlite3_step(m_put) != SQLITE_DONE) std::abort();
        sqlite3_reset(m_put);
    }
    void Commit() override { Run("COMMIT"); }
    size_t Read(std::string const& name) override
    {
        sqlite3_bind_text(m_get, 1, name.data(), static_cast<int>(name.size()), SQLITE_STATIC);
        if (sqlite3_step(m_get) != SQLITE_ROW) std::abort();
        void const* const data = sqlite3_column_blob(m_get, 0);
        size_t size = static_cast<size_t>(sqlite3_column_bytes(m_get, 0));
        if (m_compress)
            size = m_packer.Unpack(data, size);
        else
            m_copy.assign(static_cast<char const*>(data), size);
        sqlite3_reset(m_get);
        return size;
    }
    void Close() override
    {
        sqlite3_finalize(m_put);
        sqlite3_finalize(m_get);
        sqlite3_close(m_db);
    }

private:
    void Run(char const* sql)
    {
        if (sqlite3_exec(m_db, sql, nullptr, nullptr, nullptr) != SQLITE_OK) std::abort();
    }
    bool const m_compress;
    Packer m_packer;
    std::string m_copy;
    sqlite3* m_db = nullptr;
    sqlite3_stmt* m_put = nullptr;
    sqlite3_stmt* m_get = nullptr;
};
#endif

/// The limit: an append-only log with two flushes a commit, CRCs and one compression context, and no index.
class LogStore : public Store
{
public:
    explicit LogStore(bool compress) : m_compress(compress) {}
    void Create(std::string const& path) override
    {
        m_file = ::open(path.c_str(), O_RDWR | O_CREAT | O_TRUNC, 0644);
        m_end = 72;
    }
    void Open(std::string const&) override {}
    size_t List() override { return 0; }
    void Begin() override { m_held.clear(); }
    void Put(Item const& item) override
    {
        u32 crc = 0;
        CRC32::DataCRC32(item.bytes.data(), item.bytes.size(), crc);
        std::string_view bytes = item.bytes;
        if (m_compress) {
            bytes = m_packer.Pack(item.bytes);
            CRC32::DataCRC32(bytes.data(), bytes.size(), crc);
        }
        Bench::Keep(crc);
        m_places[item.name] = {m_end + m_held.size(), bytes.size(), item.bytes.size()};
        m_held += bytes;
        if (m_held.size() >= 1 << 20) WriteOut();
    }
    void Commit() override
    {
        WriteOut();
        ::fdatasync(m_file);
        char info[52] = {};
        if (::pwrite(m_file, info, sizeof(info), 12) != 52) std::abort();
        ::fdatasync(m_file);
    }
    size_t Read(std::string const& name) override
    {
        Place const& place = m_places.at(name);
        m_copy.resize(place.stored);
        if (::pread(m_file, m_copy.data(), place.stored, static_cast<off_t>(place.position)) < 0) std::abort();
        u32 crc = 0;
        CRC32::DataCRC32(m_copy.data(), m_copy.size(), crc);
        Bench::Keep(crc);
        return m_compress ? m_packer.Unpack(m_copy.data(), m_copy.size()) : m_copy.size();
    }
    void Close() override {}

private:
    struct Place
    {
        u64 position;
        u64 stored;
        u64 size;
    };
    void WriteOut()
    {
        if (::pwrite(m_file, m_held.data(), m_held.size(), static_cast<off_t>(m_end)) < 0) std::abort();
        m_end += m_held.size();
        m_held.clear();
    }
    bool const m_compress;
    Packer m_packer;
    std::unordered_map<std::string, Place> m_places;
    std::string m_held;
    std::string m_copy;
    int m_file = -1;
    u64 m_end = 0;
};

struct Subject
{
    char const* name;
    bool compress;
    std::function<std::unique_ptr<Store>()> make;
};

std::vector<Subject> MakeSubjects()
{
    std::vector<Subject> subjects;
    for (bool const zstd : {false, true}) {
        subjects.push_back({"libkernel", zstd, [zstd] { return std::make_unique<KernelStore>(zstd); }});
#ifdef KERNEL_HAVE_LMDB
        subjects.push_back({"lmdb", zstd, [zstd] { return std::make_unique<LmdbStore>(zstd); }});
#endif
#ifdef KERNEL_HAVE_SQLITE
        subjects.push_back({"sqlite WAL", zstd, [zstd] { return std::make_unique<SqliteStore>(zstd); }});
#endif
        subjects.push_back({"limit: append log", zstd, [zstd] { return std::make_unique<LogStore>(zstd); }});
    }
    return subjects;
}

void Clear(std::string const& path)
{
    for (char const* suffix : {"", "-wal", "-shm", "-lock"}) std::filesystem::remove(path + suffix);
}

void PutAll(Store& store, std::vector<Item> const& items)
{
    store.Begin();
    for (Item const& item : items) store.Put(item);
    store.Commit();
}

double RatioBase(double own, bool isOwn, double& base)
{
    if (isOwn) base = own;
    return base;
}

void Save(std::string const& path, std::vector<Item> const& items, int rounds)
{
    Bench::Table table(
        "W1: save 1,000 items of 4 to 256 KiB as one durable commit into a new file; ratio: libkernel to it");
    double own = 0;
    for (Subject const& subject : MakeSubjects()) {
        double best = 1e300;
        for (int i = 0; i < rounds; ++i) {
            Clear(path);
            ::sync();
            std::unique_ptr<Store> const store = subject.make();
            double const seconds = Bench::MedianSeconds(1, [&] {
                store->Create(path);
                PutAll(*store, items);
            });
            best = std::min(best, seconds);
            store->Close();
        }
        bool const isOwn = !std::strcmp(subject.name, "libkernel");
        RatioBase(best, isOwn, own);
        std::string const name = std::string(subject.name) + (subject.compress ? ", zstd" : "");
        table.Row("save", name.c_str(), best * 1e3, "ms", 0.0,
                  isOwn ? (subject.compress ? "<= 0.97 lmdb, <= 1.05 limit" : "<= 0.65 lmdb, <= 1.5 limit")
                        : (std::to_string(own / best) + " x").c_str());
    }
}

void Change(std::string const& path, int count, int rounds)
{
    std::vector<Item> const items = MakeItems(count, count > 5000 ? 64 : 4096, count > 5000 ? 128 : 131072);
    std::vector<Item> changed = MakeItems(10, 65536, 65536);
    std::string const title = "W2: 10 items of 64 KiB changed in a document of " + std::to_string(count) +
                              " items, median; ratio: libkernel to it";
    Bench::Table table(title.c_str());
    double own = 0;
    for (Subject const& subject : MakeSubjects()) {
        Clear(path);
        std::unique_ptr<Store> const store = subject.make();
        store->Create(path);
        PutAll(*store, items);
        u64 const before = std::filesystem::file_size(path);
        double const median = Bench::MedianSeconds(rounds, [&] { PutAll(*store, changed); });
        u64 const growth = (std::filesystem::file_size(path) - before) / static_cast<u64>(rounds);
        store->Close();
        bool const isOwn = !std::strcmp(subject.name, "libkernel");
        RatioBase(median, isOwn, own);
        std::string const name = std::string(subject.name) + (subject.compress ? ", zstd" : "");
        table.Row(("grows " + std::to_string(growth) + " B").c_str(), name.c_str(), median * 1e3, "ms", 0.0,
                  isOwn ? (subject.compress ? "<= 1.00 better of lmdb, sqlite" : "<= 1.15 lmdb, <= 1.5 sqlite")
                        : (std::to_string(own / median) + " x").c_str());
    }
}

void Read(std::string const& path, std::vector<Item> const& items, int rounds)
{
    Bench::Table table("W3: open and list, read all, 1,000 random reads, page cache warm; ratio: libkernel to it");
    double own[3] = {};
    std::mt19937 random(7);
    std::vector<size_t> order;
    for (int i = 0; i < 1000; ++i) order.push_back(random() % items.size());
    for (Subject const& subject : MakeSubjects()) {
        Clear(path);
        std::unique_ptr<Store> const store = subject.make();
        store->Create(path);
        PutAll(*store, items);
        bool const reopens = std::strncmp(subject.name, "limit", 5) != 0;
        double opening = 0;
        if (reopens) {
            store->Close();
            opening = Bench::BestSeconds(rounds, [&] {
                std::unique_ptr<Store> const fresh = subject.make();
                fresh->Open(path);
                if (fresh->List() != items.size()) std::abort();
                fresh->Close();
            });
            store->Open(path);
        }
        double const all = Bench::BestSeconds(rounds, [&] {
            for (Item const& item : items)
                if (store->Read(item.name) != item.bytes.size()) std::abort();
        });
        double const some = Bench::BestSeconds(rounds, [&] {
            for (size_t i : order) Bench::Keep(store->Read(items[i].name));
        });
        store->Close();
        bool const isOwn = !std::strcmp(subject.name, "libkernel");
        std::string const name = std::string(subject.name) + (subject.compress ? ", zstd" : "");
        double const figures[3] = {opening, all, some};
        char const* const workloads[3] = {"open + list", "read all", "1,000 random"};
        char const* const goals[3] = {"<= 0.6 lmdb", subject.compress ? "<= 1.10 lmdb, <= 1.05 limit" : "<= 2.3 lmdb",
                                      subject.compress ? "<= 1.10 lmdb, <= 1.05 limit" : "<= 2.3 lmdb"};
        for (int i = 0; i < 3; ++i) {
            if (i == 0 && !reopens) continue;
            RatioBase(figures[i], isOwn, own[i]);
            table.Row(workloads[i], name.c_str(), figures[i] * 1e3, "ms", 0.0,
                      isOwn ? goals[i] : (std::to_string(own[i] / figures[i]) + " x").c_str());
        }
    }
}

} // namespace

int main(int argc, char** argv)
{
    std::string const folder = argc > 1 ? argv[1] : ".";
    int const rounds = argc > 2 ? std::atoi(argv[2]) : 5;
    std::string const path = folder + "/bench.document";
    std::vector<Item> const items = MakeItems(1000, 4096, 131072 - 4096);
    Save(path, items, rounds);
    Change(path, 1000, 50);
    Change(path, 100000, 50);
    Read(path, items, rounds);
    Clear(path);
    return 0;
}
