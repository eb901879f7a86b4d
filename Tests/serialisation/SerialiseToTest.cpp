#include "libkernel/serialisation/SerialiseTo.h"

#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/SerialiseFrom.h"
#include "libkernel/streams/FileInStream.h"
#include "serialisation/WriterTestSupport.h"
#include "support/TempFolder.h"

#include <filesystem>
#include <stdexcept>
#include <zlib.h>

namespace KernelTest {
namespace {

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
    auto const stream = MakeCounted<BytesOutStream>();
    EXPECT_TRUE(SerialiseToStream(stream, "Sett", 9, SaveOne));
    EXPECT_EQ(Show(stream->m_bytes), Show(OneFile()));
    EXPECT_EQ(stream->GetReferenceCount(), 1);
    EXPECT_FALSE(SerialiseToStream(nullptr, "Sett", 9, SaveOne));
}

TEST(SerialiseToStream, AnythingThrownIsAFailure)
{
    std::function<void(OutSerialiser&, IDTag)> const failing[] = {
        [](OutSerialiser&, IDTag) { throw 5; },
        [](OutSerialiser&, IDTag) { throw std::runtime_error("x"); },
        [](OutSerialiser&, IDTag) { throw OutStream::WriteException(); },
        [](OutSerialiser& out, IDTag tag) {
            SaveOne(out, tag);
            SaveOne(out, tag);
        },
        nullptr,
    };
    for (auto const& save : failing) EXPECT_FALSE(SerialiseToStream(MakeCounted<BytesOutStream>(), "Sett", 9, save));
    for (u64 limit = 0; limit < OneFile().size(); ++limit)
        EXPECT_FALSE(SerialiseToStream(MakeCounted<BytesOutStream>(limit), "Sett", 9, SaveOne)) << limit;
}

class SerialiseToFileTest : public testing::Test
{
protected:
    std::string Path() const { return m_folder / "settings.bin"; }
    // Nothing but the file itself lies there, if it does.
    int CountFiles() const
    {
        int count = 0;
        for (auto const& entry : std::filesystem::directory_iterator(m_folder.GetPath()))
            count += entry.exists() ? 1 : 0;
        return count;
    }
    TestSupport::TempFolder m_folder;
};

TEST_F(SerialiseToFileTest, ReplacesTheFileWholePlainOrCompressed)
{
    TestSupport::WriteWholeFile(Path(), std::string(1000, 'x'));
    for (int const level : {0, 6}) {
        ASSERT_TRUE(SerialiseToFile(Path().c_str(), "Sett", 9, SaveOne, level));
        EXPECT_EQ(CountFiles(), 1);
        std::string bytes = TestSupport::ReadWholeFile(Path());
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
        EXPECT_TRUE(SerialiseFromFile(Path().c_str(), "Sett", 9, load, level != 0));
        EXPECT_FALSE(SerialiseFromFile(Path().c_str(), "Sett", 9, load, level == 0));
        if (level) continue;
        EXPECT_TRUE(SerialiseFromStream(FileInStream::Open(Path().c_str()), "Sett", 9, load));
        EXPECT_EQ(seen.GetView(), Path());
    }
}

TEST_F(SerialiseToFileTest, FailureLeavesTheOldFileAndNoTemporary)
{
    TestSupport::WriteWholeFile(Path(), "old");
    for (int const level : {0, 6})
        EXPECT_FALSE(SerialiseToFile(
            Path().c_str(), "Sett", 9,
            [](OutSerialiser& out, IDTag tag) {
                SaveOne(out, tag);
                throw 5;
            },
            level));
    EXPECT_EQ(TestSupport::ReadWholeFile(Path()), "old");
    EXPECT_EQ(CountFiles(), 1);
    EXPECT_FALSE(SerialiseToFile(nullptr, "Sett", 9, SaveOne, 0));
    EXPECT_FALSE(SerialiseToFile("", "Sett", 9, SaveOne, 0));
    EXPECT_FALSE(SerialiseToFile((Path() + "/below/file").c_str(), "Sett", 9, SaveOne, 0));
}

} // namespace
} // namespace KernelTest
