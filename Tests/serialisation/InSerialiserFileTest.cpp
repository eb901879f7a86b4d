#include "libkernel/serialisation/InSerialiserFile.h"

#include "libkernel/core/NestingGuard.h"
#include "libkernel/filestore/VoidFileStore.h"
#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/PropertyStreamDump.h"
#include "serialisation/ReaderClasses.h"
#include "support/PlainStreams.h"
#include "support/Rows.h"
#include "support/TraceCapture.h"

#include <gtest/gtest.h>

namespace Kernel::Test {
namespace {

Counted<ReaderNode> LoadRoot(InSerialiserFile const& file)
{
    Counted<ReaderNode> root;
    file.LoadObject("Root", root);
    return root;
}

// RdSc: loads as the test says.
class Scripted : public ReaderNode
{
public:
    bool Load(InSerialiser const& in, FileStore& store, unsigned short v) override
    {
        return s_load(in) && ReaderNode::Load(in, store, v);
    }
    static inline std::function<bool(InSerialiser const&)> s_load;
};
ClassProperties const s_scripted("RdSc", &ClassProperties::CreateNew<Scripted>, 1, nullptr, nullptr);
ClassPropertiesBase::Init const s_initScripted(&s_scripted);

// A root object of class RdNo whose properties follow.
PropertyBytes BeginRoot()
{
    PropertyBytes b;
    b.Header().Item(0x31, "Root").Object(0).RootClass("RdNo");
    return b;
}

// The header.

TEST(InSerialiserFileTest, EmptyFileOfEveryFormatVersionParses)
{
    for (u16 version : {u16(0), u16(1), u16(2)}) {
        PropertyBytes b;
        b.Header(version).End();
        Counted<InSerialiserFile> const file = Parse(b.bytes);
        ASSERT_TRUE(file);
        EXPECT_EQ(file->GetFileIDTag(), IDTag("Test"));
        EXPECT_EQ(file->GetFileVersion(), 3);
        EXPECT_EQ(file->GetBuildIndex(), version < 2 ? 0u : 24u);
    }
}

TEST(InSerialiserFileTest, WhatTheReaderIsTooOldForIsToldByExceptionAndLeavesNothingBehind)
{
    auto const start = [] { return PropertyBytes().Header(); };
    PropertyBytes const kid = BeginRoot().Append(EveryValueForm()).Item(0xB1, "Kids").U32(1).Object(1);
    int const before = ReaderNode::s_alive;
    for (auto const& [bytes, expected, wasRefused, isUnknownClass] : Rows<PropertyBytes, char const*, bool, bool>{
             {PropertyBytes().Header(3).End(), ">>> Future file version: 3 (2 max)\n", false, false},
             {start().Item(0x78, "Numb").End(), ">>> Use of unknown prop type: 120\n", false, false},
             {start().Item(0x7F, "Numb").End(), ">>> Use of unknown prop type: 127\n", false, false},
             {start().Item(0xF8, "Numb").End(), ">>> Use of unknown prop type: 120\n", false, false},
             {PropertyBytes(kid).KnownClass("RdNo").U32Item("Refu", 1).End().End().End(),
              ">>> Failed to load object: RdNo\n", true, false},
             {PropertyBytes(kid).RootClass("RdSh").U32Item("Numb", 1).End().End().End(),
              ">>> Failed to load object: RdNo\n", true, false},
             {start().Item(0x31, "Unkn").Object(0).RootClass("Xxxx").End().End(), ">>> Unknown class: Xxxx\n", false,
              true}})
        for (bool checks : {true, false}) {
            if (isUnknownClass && !checks) continue;
            TraceCapture trace;
            try {
                Parse(bytes.bytes, checks);
                ADD_FAILURE() << expected;
            } catch (FutureVersionException const& e) {
                EXPECT_EQ(e.WasRefused(), wasRefused);
                auto const* const unknown = dynamic_cast<UnknownClassUIDException const*>(&e);
                EXPECT_EQ(unknown && unknown->GetClassUID() == ClassUID("Xxxx"), isUnknownClass);
            }
            EXPECT_EQ(trace.GetText(), expected);
            EXPECT_EQ(ReaderNode::s_alive, before);
            EXPECT_EQ(NestingGuard::GetDepth(), 0u);
        }
}

// The stream.

PropertyBytes StreamWithUnknownClass()
{
    PropertyBytes b;
    b.Header().U32Item("Befo", 1);
    b.Item(0x31, "Unkn").Object(0).U8(0).Code("Xxxx").U16(1).U32Item("Dflt", 1);
    b.Item(0x31, "DfSh").Object(5).RootClass("RdSh").U32Item("Numb", 1).End().End();
    b.RootClass("RdNo", 4); // The unknown class's parent, described on the way.
    b.Append(EveryValueForm());
    b.Item(0x31, "Objt").Object(6).KnownClass("RdSh").U32Item("Numb", 1).End().Item(0x31, "Back").BackReference(6);
    b.Item(0xB1, "Objs").U32(3).U8(0).Object(7).RootClass("RdDv").End().BackReference(6).Item(0x31, "Null").U8(0);
    b.End();
    b.Item(0x31, "Node").Object(20).KnownClass("RdNo").U32Item("Numb", 6).End();
    b.Item(0x31, "Shar").Object(21).KnownClass("RdSh").U32Item("Numb", 7).End();
    b.Item(0xB1, "Arry").U32(2).Object(22).KnownClass("Xxxx").TextItem("Text", "t").End().Object(23).KnownClass("RdNo");
    return b.End().End();
}

TEST(InSerialiserFileTest, StreamIsLeftJustBehindTheList)
{
    for (auto const& [b, isKnown] :
         Rows<PropertyBytes, bool>{{EveryItemForm(), true}, {StreamWithUnknownClass(), false}}) {
        u64 const end = 6 + b.bytes.size();
        PropertyBytes const all = PropertyBytes().Text("before").Append(b).Text("behind");
        for (Delivery delivery : c_deliveries)
            for (int way = isKnown ? 0 : 1; way < 3; ++way) {
                Counted<InStream> const in = Deliver(all.bytes, delivery);
                char text[7] = {};
                ASSERT_EQ(in->ReadBlock(text, 6), 6u);
                bool const parsed = way == 0   ? bool(InSerialiserFile::ParseWithChecks(*in))
                                    : way == 1 ? bool(InSerialiserFile::ParseSkipUnknownClasses(*in))
                                               : CheckPropertyStream(*in).offset == b.bytes.size();
                EXPECT_TRUE(parsed);
                EXPECT_EQ(in->Tell(), end);
                EXPECT_EQ(in->ReadBlock(text, 6), 6u);
                EXPECT_STREQ(text, "behind");
            }
    }
}

TEST(InSerialiserFileTest, SmallPropertiesNeedFewReads)
{
    PropertyBytes b;
    b.Header();
    for (u32 i = 1; i <= 10000; ++i) b.U8(3).U32(i).U32(i);
    b.End();
    auto const seekable = MakeCounted<SeekableSource>(b.bytes);
    ASSERT_TRUE(InSerialiserFile::ParseWithChecks(*seekable));
    EXPECT_LE(seekable->readCount, 3u);
    auto const plain = MakeCounted<PlainSource>(b.bytes);
    plain->sized = false;
    ASSERT_TRUE(InSerialiserFile::ParseWithChecks(*plain));
    EXPECT_LE(plain->readCount, 10000u + 5);
}

// Objects.

TEST(InSerialiserFileTest, ListKeptBeyondItsLoadIsEmpty)
{
    // Held by a class that breaks the rule, as the list of its first object.
    static Counted<InSerialiser const> s_kept;
    Scripted::s_load = [](InSerialiser const& in) {
        if (!s_kept) s_kept = Counted<InSerialiser const>(&in);
        return true;
    };
    PropertyBytes const b =
        PropertyBytes().Header().Put("B1 [Arry] 02000000 01 00000000 00 [RdSc] 0100 00 02 2B [Name] 03000000 'one' 00"
                                     "01 01000000 01 [RdSc] 2B [Name] 03000000 'two' 00 | 00");
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    std::vector<Counted<ReaderNode>> nodes;
    ASSERT_TRUE(file && file->LoadObjects("Arry", nodes));
    EXPECT_FALSE(s_kept->HasPropertyOrDefault("Name"));
    s_kept.Reset();
}

// Defaults.

TEST(InSerialiserFileTest, DefaultsComeFromTheFileThroughTheChain)
{
    PropertyBytes b;
    b.Header().Item(0x31, "Root").Object(0);
    b.U8(0).Code("RdDv").U16(1).TextItem("Name", "derived");
    for (u32 i = 2000; i > 1000; --i) b.U8(3).U32(i).U32(i); // Many are found in another way than few.
    b.End().U8(0).Code("RdNo").U16(6).TextItem("Name", "base");
    for (u32 i = 1; i <= 1500; ++i) b.U8(3).U32(i).U32(0);
    b.U32Item("Numb", 31).End().U8(2).End();
    b.Item(0x31, "Othr").Object(1).KnownClass("RdNo").U32Item("Numb", 32).End().End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    ASSERT_TRUE(file);
    Counted<ReaderNode> const root = LoadRoot(*file);
    ASSERT_TRUE(root);
    EXPECT_EQ(root->name, "derived");
    EXPECT_EQ(root->number, 31u);
    EXPECT_TRUE(root->numberIsDefault);
    EXPECT_EQ(root->version, 1);
    EXPECT_TRUE(root->GetObjectClassProperties()->IsPolymorphicType("RdDv"));
    EXPECT_TRUE(root->GetObjectClassProperties()->IsPolymorphicType("RdNo"));
    Counted<ReaderNode> other;
    ASSERT_TRUE(file->LoadObject("Othr", other));
    EXPECT_EQ(other->name, "base");
    EXPECT_EQ(other->number, 32u);
    EXPECT_FALSE(other->numberIsDefault);
    EXPECT_EQ(other->version, 6);
    EXPECT_FALSE(other->GetObjectClassProperties()->IsPolymorphicType("RdDv"));
}

TEST(InSerialiserFileTest, ClassDescribedInsideADefaultObjectStaysKnown)
{
    // A default object of a shared class, whose own description comes there, and objects of both afterwards.
    PropertyBytes b;
    b.Header().Item(0x31, "Root").Object(0).U8(0).Code("RdNo").U16(1);
    b.Item(0x31, "Shrd").Object(1).U8(0).Code("RdSh").U16(1).U32Item("Numb", 4100).End().U8(2);
    b.End(); // Object 1, with Numb from the defaults.
    b.TextItem("Name", "kept").End().U8(2).End();
    b.Item(0x31, "Shr2").Object(2).KnownClass("RdSh").End().End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    ASSERT_TRUE(file);
    Counted<ReaderNode> const root = LoadRoot(*file);
    ASSERT_TRUE(root && root->shared);
    EXPECT_EQ(root->name, "kept");
    Consolidated<ReaderShared> shared;
    ASSERT_TRUE(file->LoadSharedObject("Shr2", shared));
    EXPECT_TRUE(shared == root->shared);
    EXPECT_EQ(shared->number, 4100u);
}

// Parents.

TEST(InSerialiserFileTest, ParentsThatDisagreeAreTracedAndTheLoadGoesOn)
{
    // The class, the parent that the file gives it ("" for none, a root class if any), and what is traced.
    for (auto const& [uid, parent, expected] : Rows<char const*, char const*, char const*>{
             {"RdNo", "", ""},
             {"RdNo", "Xxxx", ">>> Unknown class: Xxxx\n>>> Unexpected parent class for RdNo:  Unknown (see above)\n"},
             {"RdNo", "RdDv", ">>> Unexpected parent class for RdNo:  Found RdDv\n"},
             {"RdDv", "", ""},
             {"RdDv", "Xxxx", ">>> Unknown class: Xxxx\n>>> Missing parent class for RdDv:  Expected RdNo\n"},
             {"RdDv", "RdLg", ">>> Incorrect parent class for RdDv:  Found RdLg  Expected RdNo\n"},
             {"RdDv", "RdNo", ""},
             {"RdLg", "RdNo", ""}})
    { // A legacy class.
        SCOPED_TRACE(testing::Message() << uid << " below " << parent);
        PropertyBytes b;
        b.Header().Put("31 [Root] 01 00000000 00 [" + std::string(uid) + "] 0100 03 [Numb] 02000000 00");
        if (*parent) b.Put("00 [" + std::string(parent) + "] 0100 2B [Name] 0D000000 'of the parent' 00");
        b.Put("02 00 00");
        TraceCapture trace;
        Counted<InSerialiserFile> const file = Parse(b.bytes, false);
        ASSERT_TRUE(file);
        EXPECT_EQ(trace.GetText(), expected);
        Counted<ReaderNode> const root = LoadRoot(*file);
        ASSERT_TRUE(root);
        bool const hasParent = *parent && std::string_view(parent) != "Xxxx";
        EXPECT_EQ(root->name, hasParent ? "of the parent" : ""); // The chain is the file's.
    }
}

// Unknown classes.

TEST(InSerialiserFileTest, UnknownClassBecomesNullInATolerantParse)
{
    PropertyBytes const b = StreamWithUnknownClass();
    for (Delivery delivery : c_deliveries) {
        TraceCapture trace;
        Counted<InSerialiserFile> const file = Parse(b.bytes, false, delivery);
        ASSERT_TRUE(file) << static_cast<int>(delivery);
        EXPECT_EQ(trace.GetText().find(">>> Unknown class: Xxxx\n"), 0u);
        Counted<Serialisable> object(new ReaderNode);
        EXPECT_TRUE(file->LoadObject("Unkn", object) && !object);
        Counted<ReaderNode> node;
        ASSERT_TRUE(file->LoadObject("Node", node) && node);
        EXPECT_EQ(node->version, 4);
        EXPECT_EQ(node->number, 6u);
        Consolidated<ReaderShared> shared;
        ASSERT_TRUE(file->LoadSharedObject("Shar", shared) && shared);
        std::vector<Counted<ReaderNode>> nodes;
        ASSERT_TRUE(file->LoadObjects("Arry", nodes));
        EXPECT_TRUE(!nodes[0] && nodes[1]);
        EXPECT_TRUE(file->HasProperty("Befo"));
    }
}

// Progress and report.

TEST(InSerialiserFileTest, ProgressComesOncePerNewObjectAndEndsTheParse)
{
    PropertyBytes b = BeginRoot();
    b.Item(0x31, "Chld").Object(1).KnownClass("RdNo").End().Item(0x31, "Refr").BackReference(1).End().End();
    std::vector<float> seen;
    auto const parse = [&](size_t stopAt, Delivery delivery) {
        seen.clear();
        auto const progress = [&](float done) {
            seen.push_back(done);
            return seen.size() != stopAt;
        };
        return InSerialiserFile::ParseWithChecks(*Deliver(b.bytes, delivery), VoidFileStore::GetInstance(),
                                                 InSerialiser::DelayLoadsBehaviour::Leave, progress, {});
    };
    EXPECT_TRUE(parse(0, Delivery::Memory));
    ASSERT_EQ(seen.size(), 2u);
    EXPECT_GT(seen[0], 0.0f);
    EXPECT_GT(seen[1], seen[0]);
    EXPECT_LE(seen[1], 1.0f);
    EXPECT_TRUE(parse(0, Delivery::Unsized));
    EXPECT_EQ(seen, (std::vector<float>{0, 0}));
    EXPECT_FALSE(parse(2, Delivery::Memory));
    EXPECT_FALSE(parse(1, Delivery::Memory));
    EXPECT_EQ(seen.size(), 1u);
}

TEST(InSerialiserFileTest, ReportNamesObjectsThatWereTakenAndDropped)
{
    Scripted::s_load = [](InSerialiser const& in) { // Its child as a reference, of which it keeps nothing.
        Counted<ReaderNode> dropped;
        return in.LoadObject("Chld", dropped, false) && dropped->number == 3 && !(in.TearDown("Chld"), false);
    };
    PropertyBytes const b = PropertyBytes().Header().Put(
        "31 [Root] 01 00000000 00 [RdSc] 0100 00 02 | 31 [Chld] 01 01000000 00 [RdNo] 0100 00 02 03 [Numb] 03000000 00"
        "31 [Nevr] 01 02000000 01 [RdNo] 03 [Numb] 04000000 00 | 00"
        "31 [Shar] 01 03000000 00 [RdSh] 0100 00 02 03 [Numb] 01000000 00 | 00");
    std::vector<u32> numbers;
    size_t others = 0;
    auto const end = [&](std::vector<NonCounted<Serialisable>> const& dropped,
                         std::vector<NonCounted<Serialisable>> const& rest) {
        for (auto const& object : dropped) numbers.push_back(dynamic_cast<ReaderNode const&>(*object).number);
        others = rest.size();
    };
    auto const parse = [&](PropertyBytes const& bytes) {
        return InSerialiserFile::ParseWithChecks(*Deliver(bytes.bytes, Delivery::Memory), VoidFileStore::GetInstance(),
                                                 InSerialiser::DelayLoadsBehaviour::Leave, {}, end);
    };
    ASSERT_TRUE(parse(b));
    EXPECT_EQ(numbers, std::vector<u32>{3});
    EXPECT_EQ(others, 2u); // The root, which the file holds, and the one that nobody took.
    // Nothing dropped, nothing told.
    numbers.clear();
    others = 0;
    PropertyBytes kept = BeginRoot();
    kept.Item(0x31, "Chld").Object(1).KnownClass("RdNo").End().End().End();
    ASSERT_TRUE(parse(kept));
    EXPECT_TRUE(numbers.empty() && others == 0);
}

} // namespace
} // namespace Kernel::Test
