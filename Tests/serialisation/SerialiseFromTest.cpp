#include "libkernel/serialisation/SerialiseFrom.h"

#include "libkernel/core/Limits.h"
#include "libkernel/serialisation/InSerialiser.h"
#include "libkernel/serialisation/SerialiseTo.h"
#include "serialisation/ReaderClasses.h"
#include "support/TempFolder.h"

#include <gtest/gtest.h>
#include <string>

namespace Kernel::Test {
namespace {

constexpr IDTag c_kind("Test");

TEST(SerialiseFromTest, KindAndVersionAreCheckedAndWhateverIsThrownGivesFalse)
{
    PropertyBytes const good = PropertyBytes().Header().End(); // Kind "Test", version 3.
    PropertyBytes const newer = PropertyBytes().Header(3).End();
    using Load = std::function<bool(InSerialiser&, IDTag)>;
    int calls = 0;
    Load const yes = [&](InSerialiser&, IDTag tag) { return ++calls && tag == IDTag("Item"); };
    struct
    {
        PropertyBytes const& bytes;
        IDTag kind;
        u16 version;
        Load load;
        bool loads;
    } const cases[] = {
        {good, "Test", 3, yes, true},
        {good, "Test", 9, yes, true},
        {good, "Test", 2, yes, false},
        {good, "Othr", 3, yes, false},
        {newer, "Test", 9, yes, false},
        {good, "Test", 9, [](InSerialiser&, IDTag) -> bool { throw 5; }, false},
        {good, "Test", 9, [](InSerialiser&, IDTag) { return false; }, false},
    };
    for (auto const& c : cases)
        EXPECT_EQ(SerialiseFromStream(Deliver(c.bytes.bytes, Delivery::Memory), c.kind, c.version, c.load), c.loads);
    EXPECT_FALSE(SerialiseFromStream(nullptr, c_kind, 9, yes));
    EXPECT_FALSE(SerialiseFromFile("/nowhere/at/all", c_kind, 9, yes, false));
    EXPECT_FALSE(SerialiseFromFile(nullptr, c_kind, 9, yes, false));
    EXPECT_EQ(calls, 2);
}

TEST(SerialiseFromTest, DeepestGraphThatCanBeSavedCanBeRead)
{
    TestSupport::TempFolder const folder;
    std::string const path = folder / "deep";
    bool saved = true;
    u32 deepest = 0;
    for (u32 depth = c_maxNesting - 3; depth <= c_maxNesting + 2; ++depth) {
        Counted<ReaderNode> top;
        for (u32 i = 0; i < depth; ++i) {
            Counted<ReaderNode> node(new ReaderNode);
            node->child = std::move(top);
            top = std::move(node);
        }
        saved = SerialiseToFile(
            path.c_str(), c_kind, 1, [&](OutSerialiser& out, IDTag tag) { out.SaveObject(tag, top); }, 0);
        if (!saved) continue;
        deepest = depth;
        EXPECT_TRUE(SerialiseFromFile(
            path.c_str(), c_kind, 1,
            [](InSerialiser& in, IDTag tag) {
                Counted<ReaderNode> loaded;
                return in.LoadObject(tag, loaded);
            },
            false))
            << depth;
    }
    EXPECT_FALSE(saved);
    EXPECT_GE(deepest, c_maxNesting - 1);
}

} // namespace
} // namespace Kernel::Test
