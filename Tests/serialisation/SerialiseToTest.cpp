#include "libkernel/serialisation/SerialiseTo.h"

#include "libkernel/core/Limits.h"
#include "libkernel/serialisation/SerialiseFrom.h"
#include "libkernel/streams/FileInStream.h"
#include "libkernel/streams/MemoryStreams.h"
#include "serialisation/ReaderClasses.h"
#include "serialisation/WriterTestSupport.h"
#include "support/FileFixture.h"
#include "support/Rows.h"

#include <stdexcept>
#include <zlib.h>

namespace KernelTest {
namespace {

using SaveItem = std::function<void(OutSerialiser&, IDTag)>;
using LoadItem = std::function<bool(InSerialiser&, IDTag)>;

void SaveOne(OutSerialiser& out, IDTag tag)
{
    out.SaveType(tag, u8{7});
}

std::string const& OneFile()
{
    static std::string const bytes = Bytes("00 FF 4B 53 | 02 00 | [Sett] | 09 00 | 18 00 00 00 | 01 [Item] 07 | 00");
    return bytes;
}

TEST(SerialiseToStream, WritesTheWholeFileAndLetsGoOfTheStream)
{
    auto const stream = MakeCounted<PlainTarget>();
    EXPECT_TRUE(SerialiseToStream(stream, "Sett", 9, SaveOne));
    EXPECT_EQ(Show(stream->bytes), Show(OneFile()));
    EXPECT_EQ(stream->GetReferenceCount(), 1);
    EXPECT_FALSE(SerialiseToStream(nullptr, "Sett", 9, SaveOne));
}

TEST(SerialiseToStream, AnythingThrownIsAFailure)
{
    SaveItem const failing[] = {
        [](OutSerialiser&, IDTag) { throw 5; },
        [](OutSerialiser&, IDTag) { throw std::runtime_error("x"); },
        [](OutSerialiser&, IDTag) { throw OutStream::WriteException(); },
        [](OutSerialiser& out, IDTag tag) { SaveOne(out, tag), SaveOne(out, tag); },
        nullptr,
    };
    for (auto const& save : failing) EXPECT_FALSE(SerialiseToStream(MakeCounted<PlainTarget>(), "Sett", 9, save));
    for (u64 limit = 0; limit < OneFile().size(); ++limit)
        EXPECT_FALSE(SerialiseToStream(MakeCounted<PlainTarget>(limit), "Sett", 9, SaveOne)) << limit;
}

TEST(SerialiseFromStream, KindAndVersionAreCheckedAndWhateverIsThrownGivesFalse)
{
    std::string newer = OneFile();
    newer[4] = 3;
    int calls = 0;
    LoadItem const yes = [&](InSerialiser&, IDTag tag) { return ++calls && tag == IDTag("Item"); };
    for (auto const& [bytes, kind, version, load, loads] : Rows<std::string, IDTag, u16, LoadItem, bool>{
             {OneFile(), "Sett", 9, yes, true},
             {OneFile(), "Sett", 19, yes, true},
             {OneFile(), "Sett", 8, yes, false},
             {OneFile(), "Othr", 9, yes, false},
             {newer, "Sett", 9, yes, false},
             {OneFile(), "Sett", 9, [](InSerialiser&, IDTag) -> bool { throw 5; }, false},
             {OneFile(), "Sett", 9, [](InSerialiser&, IDTag) { return false; }, false}})
    {
        Counted<InStream> const in(new MemoryInStream(bytes.data(), bytes.size(), false));
        EXPECT_EQ(SerialiseFromStream(in, kind, version, load), loads);
    }
    EXPECT_FALSE(SerialiseFromStream(nullptr, "Sett", 9, yes));
    EXPECT_FALSE(SerialiseFromFile("/nowhere/at/all", "Sett", 9, yes, false));
    EXPECT_FALSE(SerialiseFromFile(nullptr, "Sett", 9, yes, false));
    EXPECT_EQ(calls, 2);
}

class SerialiseToFileTest : public TestSupport::FileFixture
{
protected:
    bool Save(SaveItem const& save, int level = 0) const
    {
        return SerialiseToFile(m_path.c_str(), "Sett", 9, save, level);
    }
    // Nothing but the file itself lies there.
    bool IsAlone() const
    {
        auto const in = std::filesystem::directory_iterator(m_folder.GetPath());
        return std::distance(begin(in), end(in)) == 1 && std::filesystem::exists(m_path);
    }
};

TEST_F(SerialiseToFileTest, ReplacesTheFileWholePlainOrCompressed)
{
    TestSupport::WriteWholeFile(m_path, std::string(1000, 'x'));
    for (int const level : {0, 6}) {
        ASSERT_TRUE(Save(SaveOne, level));
        EXPECT_TRUE(IsAlone());
        std::string bytes = TestSupport::ReadWholeFile(m_path);
        if (level) {
            std::string const packed = bytes;
            uLongf size = 1000;
            bytes.resize(size);
            ASSERT_EQ(uncompress(reinterpret_cast<Bytef*>(bytes.data()), &size,
                                 reinterpret_cast<Bytef const*>(packed.data()), packed.size()),
                      Z_OK);
            bytes.resize(size);
        }
        EXPECT_EQ(Show(bytes), Show(OneFile()));

        String8 seen;
        auto const load = [&](InSerialiser& in, IDTag tag) {
            u8 value = 0;
            seen = in.GetFilePath();
            return in.LoadType(tag, value) && value == 7;
        };
        EXPECT_TRUE(SerialiseFromFile(m_path.c_str(), "Sett", 9, load, level != 0));
        EXPECT_FALSE(SerialiseFromFile(m_path.c_str(), "Sett", 9, load, level == 0));
        if (level) continue;
        EXPECT_TRUE(SerialiseFromStream(FileInStream::Open(m_path.c_str()), "Sett", 9, load));
        EXPECT_EQ(seen.GetView(), m_path);
    }
}

TEST_F(SerialiseToFileTest, FailureLeavesTheOldFileAndNoTemporary)
{
    TestSupport::WriteWholeFile(m_path, "old");
    for (int const level : {0, 6}) EXPECT_FALSE(Save([](OutSerialiser& o, IDTag t) { SaveOne(o, t), throw 5; }, level));
    EXPECT_EQ(TestSupport::ReadWholeFile(m_path), "old");
    EXPECT_TRUE(IsAlone());
    std::string const below = m_path + "/below/file";
    for (char const* path : {static_cast<char const*>(nullptr), "", below.c_str()})
        EXPECT_FALSE(SerialiseToFile(path, "Sett", 9, SaveOne, 0));
}

TEST_F(SerialiseToFileTest, DeepestGraphThatCanBeSavedCanBeRead)
{
    using Kernel::Test::ReaderNode;
    LoadItem const load = [](InSerialiser& in, IDTag tag) {
        Counted<ReaderNode> loaded;
        return in.LoadObject(tag, loaded);
    };
    u32 deepest = 0;
    for (u32 depth = c_maxNesting - 3; depth <= c_maxNesting + 2; ++depth) {
        Counted<ReaderNode> top;
        for (u32 i = 0; i < depth; ++i) {
            Counted<ReaderNode> node(new ReaderNode);
            node->child = std::move(top);
            top = std::move(node);
        }
        if (!Save([&](OutSerialiser& out, IDTag tag) { out.SaveObject(tag, top); })) continue;
        deepest = depth;
        EXPECT_TRUE(SerialiseFromFile(m_path.c_str(), "Sett", 9, load, false)) << depth;
    }
    EXPECT_GE(deepest, c_maxNesting - 1);
    EXPECT_LT(deepest, c_maxNesting + 2);
}

} // namespace
} // namespace KernelTest
