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

TEST(SerialiseFromTest, KindAndVersionAreChecked)
{
    PropertyBytes b;
    b.Header().End(); // Kind "Test", version 3.
    struct
    {
        IDTag kind;
        u16 version;
        bool loads;
    } const cases[] = {{"Test", 3, true}, {"Test", 9, true}, {"Test", 2, false}, {"Othr", 3, false}};
    for (auto const& c : cases) {
        bool called = false;
        EXPECT_EQ(SerialiseFromStream(Deliver(b.bytes, Delivery::Memory), c.kind, c.version,
                                      [&](InSerialiser&, IDTag tag) {
                                          called = true;
                                          return tag == IDTag("Item");
                                      }),
                  c.loads);
        EXPECT_EQ(called, c.loads);
    }
}

TEST(SerialiseFromTest, WhateverIsThrownGivesFalse)
{
    PropertyBytes good;
    good.Header().End();
    PropertyBytes newer;
    newer.Header(3).End();
    auto const yes = [](InSerialiser&, IDTag) { return true; };
    EXPECT_FALSE(SerialiseFromStream(nullptr, c_kind, 9, yes));
    EXPECT_FALSE(SerialiseFromStream(Deliver(newer.bytes, Delivery::Memory), c_kind, 9, yes));
    EXPECT_FALSE(SerialiseFromStream(Deliver(good.bytes, Delivery::Memory), c_kind, 9,
                                     [](InSerialiser&, IDTag) -> bool { throw 5; }));
    EXPECT_FALSE(SerialiseFromStream(Deliver(good.bytes, Delivery::Memory), c_kind, 9,
                                     [](InSerialiser&, IDTag) { return false; }));
    EXPECT_FALSE(SerialiseFromFile("/nowhere/at/all", c_kind, 9, yes, false));
    EXPECT_FALSE(SerialiseFromFile(nullptr, c_kind, 9, yes, false));
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
