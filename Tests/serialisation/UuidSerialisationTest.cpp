#include "libkernel/core/Uuid.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/SerialiseFrom.h"
#include "libkernel/streams/MemoryStreams.h"
#include "serialisation/WriterTestSupport.h"

namespace KernelTest {
namespace {

TEST(UuidSerialisationTest, IdentifierIsOneRawStructOfItsBytes)
{
    Uuid const id("00112233-4455-6677-8899-AABBCCDDEEFF");
    auto const save = [&](OutSerialiser& out) { id.Save(out, IDTag("Iden")); };
    EXPECT_EQ(Show(SaveList(save)), Show(Bytes("44 [Iden] 33221100 5544 7766 8899AABBCCDDEEFF | 00")));

    auto const stream = MakeCounted<BytesOutStream>();
    {
        OutSerialiserFile out(*stream, IDTag("Test"), 1);
        save(out);
        out.Close();
    }
    auto const in = MakeCounted<MemoryInStream>(stream->m_bytes.data(), stream->m_bytes.size(), false);
    EXPECT_TRUE(SerialiseFromStream(in, IDTag("Test"), 1, [&](InSerialiser& file, IDTag) {
        Uuid loaded;
        Uuid const fresh(loaded);
        EXPECT_FALSE(loaded.Load(file, IDTag("Othr")));
        EXPECT_EQ(loaded, fresh);
        EXPECT_TRUE(loaded.Load(file, IDTag("Iden")));
        EXPECT_EQ(loaded, id);
        return true;
    }));
}

} // namespace
} // namespace KernelTest
