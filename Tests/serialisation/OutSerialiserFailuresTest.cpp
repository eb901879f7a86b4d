#include "libkernel/filestore/FileStoreOutPathGenerator.h"
#include "libkernel/filestore/VoidFileStore.h"
#include "libkernel/serialisation/OutSerialiserPropertyDataStream.h"
#include "serialisation/WriterTestSupport.h"
#include "support/MemoryFileStore.h"
#include "support/Rows.h"

namespace KernelTest {
namespace {

using SaveException = OutSerialiser::SaveException;

struct Point
{
    static ClassUID GetClassUID() { return "Poin"; }
    static unsigned short GetSchemaVersion() { return 3; }
    void Save(OutSerialiser& out) const { out.SaveType("XXXX", u8{1}); }
};

TEST(OutSerialiserFailures, EachMisuseHasItsCode)
{
    EnumSerialiser enums;
    enums.RegisterEnumSet({{1}, {5, 1}});
    FlagSerialiser flags;
    flags.RegisterFlagIndices({{2}, {0}});
    static u8 const huge[65536] = {};
    static auto const beginChild = [](OutSerialiser& o) {
        o.StartClassTestI("Tag1"), o.StartClassBeginI("Tag1", "Poin", 1);
    };
    using Stream = OutSerialiserPropertyDataStream;
    for (auto const& [what, save, code] : Rows<char const*, SaveFunction, int>{
             {"tag twice", [](OutSerialiser& o) { o.SaveType("Tag1", 1), o.SaveType("Tag1", String8("other")); }, 3},
             {"tag after a class",
              [](OutSerialiser& o) { o.SaveClass("Tag1", Point()), o.SaveObject("Tag1", nullptr); }, 3},
             {"struct of 65,536 bytes", [](OutSerialiser& o) { o.SavePropertyStructI("Tag1", huge, 65536); }, 2},
             {"struct of 65,535 bytes", [](OutSerialiser& o) { o.SavePropertyStructI("Tag1", huge, 65535); }, -1},
             {"structs of 65,536 bytes", [](OutSerialiser& o) { o.SavePropertyStructArrayI("Tag1", huge, 65536, 1); },
              2},
             {"2^32 structs", [](OutSerialiser& o) { o.SavePropertyStructArrayI("Tag1", huge, 1, u64{1} << 32); }, 2},
             {"2^32 numbers", [](OutSerialiser& o) { o.SaveTypes("Tag1", huge, u64{1} << 32); }, 2},
             {"2^32 bytes", [](OutSerialiser& o) { o.SaveRawData("Tag1", huge, u64{1} << 32); }, 2},
             {"raw struct of 0 bytes", [](OutSerialiser& o) { o.SaveRawStructI("Tag1", huge, 0); }, 2},
             {"raw struct of 64 bytes", [](OutSerialiser& o) { o.SaveRawStructI("Tag1", huge, 64); }, -1},
             {"raw struct of 65 bytes", [](OutSerialiser& o) { o.SaveRawStructI("Tag1", huge, 65); }, 2},
             {"unknown enum", [&](OutSerialiser& o) { o.SaveEnum("Tag1", enums, 2); }, 4},
             {"retired enum", [&](OutSerialiser& o) { o.SaveEnum("Tag1", enums, 5); }, 4},
             {"unknown enums", [&](OutSerialiser& o) { o.SaveEnums("Tag1", enums, std::vector<int>(2, 2)); }, 4},
             {"unknown flag", [&](OutSerialiser& o) { o.SaveFlagSet("Tag1", flags, u8{2}); }, 4},
             {"alignment of 9", [](OutSerialiser& o) { o.SaveAlignedRawData("Tag1", huge, 1, 9); }, 5},
             {"type of variable size", [](OutSerialiser& o) { o.SaveTypeI("Tag1", PropType::String, huge, 4); }, 5},
             {"size that is not the type's", [](OutSerialiser& o) { o.SaveTypeI("Tag1", PropType::UInt16, huge, 4); },
              5},
             {"data stream below an open one",
              [](OutSerialiser& o) { Stream const first(o, "Tag1", 1), second(o, "Tag2", 1); }, 5},
             {"value beside an open data stream",
              [](OutSerialiser& o) {
                  Stream stream(o, "Tag1", 1);
                  stream.Close(), o.SaveType("Tag2", 1);
              },
              3},
             {"value after the data stream's end",
              [](OutSerialiser& o) {
                  Stream stream(o, "Tag1", 1);
                  stream.Close(), stream.SaveValue(1);
              },
              5},
             {"object in a data stream",
              [](OutSerialiser& o) { Stream(o, "Tag1", 1).SaveValueI(PropType::Object, huge, 1); }, 5},
             {"list closed below a child", [](OutSerialiser& o) { beginChild(o), o.Close(); }, 3},
             {"value beside a child", [](OutSerialiser& o) { beginChild(o), o.SaveType("Tag2", 1); }, 3},
             {"value after the end", [](OutSerialiser& o) { o.Close(), o.SaveType("Tag1", 1); }, 5},
         })
        EXPECT_EQ(ListCode(save), code) << what;
}

TEST(OutSerialiserFailures, LongListRemembersEveryTag)
{
    for (u32 const again : {0u, 20u, 30u, 199u}) {
        SCOPED_TRACE(again);
        int const code = ListCode([&](OutSerialiser& out) {
            for (u32 i = 0; i < 200; ++i) out.SaveType(IDTag(i * 0x9E3779B9u), u8{1});
            EXPECT_FALSE(out.HasProperty(IDTag(200 * 0x9E3779B9u)));
            out.SaveType(IDTag(again * 0x9E3779B9u), u8{1});
        });
        EXPECT_EQ(code, 3);
    }
}

// Whatever the number of bytes that the stream takes, the save fails with code 0 unless it takes them all, and what it
// took is the beginning of the file.
TEST(OutSerialiserFailures, ShortWriteAtAnyByteIsReported)
{
    std::string const block(40000, 'b');
    auto const save = [&](OutStream& stream) {
        OutSerialiserFile out(stream, IDTag("Test"), 1);
        for (u32 i = 0; i < 3; ++i) {
            out.SaveType(IDTag(3 * i), "text");
            out.SaveClass(IDTag(3 * i + 1), Point());
            out.SaveRawData(IDTag(3 * i + 2), block.data(), block.size() >> (4 * i));
        }
        out.Close();
    };
    auto const whole = MakeCounted<PlainTarget>();
    save(*whole);
    std::string const expected = whole->bytes;
    for (u64 limit = 0; limit < expected.size(); limit += limit < 200 || limit + 200 > expected.size() ? 1 : 997) {
        auto const stream = MakeCounted<PlainTarget>(limit);
        ASSERT_EQ(SaveCode([&] { save(*stream); }), 0) << limit;
        ASSERT_TRUE(expected.starts_with(stream->bytes)) << limit;
    }
}

TEST(OutSerialiserFailures, NothingIsWrittenAfterAFailure)
{
    auto const stream = MakeCounted<PlainTarget>(u64{20});
    {
        OutSerialiserFile out(*stream, IDTag("Test"), 1);
        std::string const block(20000, 'b');
        EXPECT_EQ(SaveCode([&] { out.SaveRawData("Tag1", block.data(), block.size()); }), 0);
        stream->room = 1000000;
        EXPECT_EQ(SaveCode([&] { out.SaveType("Tag2", 1); }), 0);
        EXPECT_EQ(SaveCode([&] { out.Close(); }), 0);
    }
    EXPECT_EQ(stream->bytes.size(), 20u);
}

TEST(OutSerialiserFailures, AbortEndsTheSaveAtTheNextProperty)
{
    bool abort = false;
    RecordingOut store(VoidFileStore::GetInstance(), FileStoreOut::PurposeSave, &abort);
    auto const stream = MakeCounted<PlainTarget>();
    OutSerialiserFile out(*stream, store, IDTag("Test"), 1);
    OutSerialiserPropertyDataStream values(out, "Strm", 1);
    abort = true;
    values.SaveValue(1);
    values.Close();
    // A size that can't be is told before the abort.
    EXPECT_EQ(SaveCode([&] { out.SaveRawStructI("Tag1", nullptr, 65); }), 2);
    EXPECT_FALSE(store.WasAborted());
    EXPECT_THROW(out.SaveType("Tag1", 1), AbortException);
    EXPECT_TRUE(store.WasAborted());
    EXPECT_FALSE(out.HasProperty("Tag1"));
}

TEST(OutSerialiserFailures, DelayLoadReferenceNamesTheItemAndQueuesIt)
{
    RecordingOut store(VoidFileStore::GetInstance());
    auto const stream = MakeCounted<PlainTarget>();
    auto const item = MakeCounted<MemoryItem>();
    auto const holder = DelayLoadHolder::Create(&MemoryItem::c_plain, item);
    FileStoreOutIndexedPathGenerator generator(store, "pic/", ".x");
    OutSerialiserFile out(*stream, store, IDTag("Test"), 1);
    out.SaveDelayLoadObject("Pic1", holder, generator, nullptr);
    out.SaveDelayLoadObject("Pic2", nullptr, generator, nullptr);
    out.Close();
    EXPECT_EQ(Show(stream->bytes.substr(16)),
              Show(Bytes("33 [Pic1] [TsPl] 07 00 00 00 'pic/1.x' | 33 [Pic2] 00 00 00 00 00 00 00 00 | 00")));
    EXPECT_EQ(store.files, (std::vector<Counted<DelayLoadHolder>>{holder}));
    ASSERT_EQ(store.assigned.size(), 1u);
    EXPECT_EQ(store.assigned[0].second, "pic/1.x");

    FileStoreOutIndexedPathGenerator refusing(VoidFileStoreOut::GetInstance(), "pic/", "");
    EXPECT_EQ(ListCode([&](OutSerialiser& o) { o.SaveDelayLoadObject("Pic1", holder, refusing, nullptr); }), 6);
}

TEST(OutSerialiserFailures, EnumeratingPassWalksTheStructureAndWritesNothing)
{
    auto const item = MakeCounted<MemoryItem>();
    auto const holder = DelayLoadHolder::Create(&MemoryItem::c_plain, item);
    for (auto const purpose : {FileStoreOut::PurposeEnumeratePaths, FileStoreOut::PurposeEnumerateHolders}) {
        SCOPED_TRACE(static_cast<u32>(purpose));
        RecordingOut store(VoidFileStore::GetInstance(), purpose);
        auto const stream = MakeCounted<PlainTarget>(u64{0});
        int saves = 0;
        ClassProperties const description = MakeClass("Albm");
        auto const album = MakeCounted<Thing>(&description);
        album->m_save = [&](OutSerialiser& o) {
            ++saves;
            o.SaveType("Tag1", 1);
            o.SaveType("Tag1", 1); // Values do nothing on a pass that enumerates, so this is not seen.
            o.SaveObject("Self", album.Get(), false);
            o.SaveClasses("Clas", std::vector<Point>(2));
            OutSerialiserPropertyDataStream(o, "Strm", 1).SaveValue(1);
            FileStoreOutIndexedPathGenerator generator(o.GetFileStoreOut(), "pic/", "");
            o.SaveDelayLoadObject("Pict", holder, generator, nullptr);
            o.SaveDelayLoadObject("None", nullptr, generator, nullptr);
        };
        OutSerialiserFile out(*stream, store, IDTag("Test"), 1);
        EXPECT_FALSE(out.IsFullSave());
        out.SaveObjects("Albm", std::vector<Counted<Thing>>{album, album, nullptr});
        out.Close();
        EXPECT_TRUE(stream->writes.empty());
        EXPECT_EQ(saves, 1);
        EXPECT_EQ(store.files, (std::vector<Counted<DelayLoadHolder>>{holder}));
        bool const wantsPaths = purpose == FileStoreOut::PurposeEnumeratePaths;
        EXPECT_EQ(store.assigned.size(), wantsPaths ? 1u : 0u);
    }
}

} // namespace
} // namespace KernelTest
