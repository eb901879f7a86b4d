#include "libkernel/serialisation/InSerialiserFile.h"

#include "libkernel/filestore/VoidFileStore.h"
#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/PropertyStreamDump.h"
#include "serialisation/ReaderClasses.h"
#include "support/ScriptedInStream.h"
#include "support/TraceCapture.h"

#include <gtest/gtest.h>
#include <limits>

namespace Kernel::Test {
namespace {

Counted<ReaderNode> LoadRoot(InSerialiserFile const& file)
{
    Counted<ReaderNode> root;
    file.LoadObject("Root", root);
    return root;
}

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
        EXPECT_TRUE(file->GetFilePath().IsEmpty());
        EXPECT_FALSE(file->FoundMissingFiles());
    }
}

TEST(InSerialiserFileTest, LaterFormatVersionIsToldByException)
{
    PropertyBytes b;
    b.Header(3).End();
    for (bool checks : {true, false}) {
        TraceCapture trace;
        try {
            Parse(b.bytes, checks);
            FAIL();
        } catch (FutureVersionException const& e) {
            EXPECT_FALSE(e.WasRefused());
        }
        EXPECT_EQ(trace.GetText(), ">>> Future file version: 3 (2 max)\n");
    }
}

TEST(InSerialiserFileTest, UnknownPropertyTypeIsToldByException)
{
    for (u8 type : {u8(0x78), u8(0x7F), u8(0xF8)}) {
        PropertyBytes b;
        b.Header().Item(type, "Numb").End();
        TraceCapture trace;
        EXPECT_THROW(Parse(b.bytes), FutureVersionException);
        EXPECT_EQ(trace.GetText(), ">>> Use of unknown prop type: " + std::to_string(type & 0x7F) + "\n");
    }
}

TEST(InSerialiserFileTest, OtherFormatsAndCutHeadersGiveNull)
{
    PropertyBytes b;
    b.Header().End();
    std::vector<u8> wrong = b.bytes;
    wrong[3] = 'L';
    EXPECT_FALSE(Parse(wrong));
    for (size_t size = 0; size < b.bytes.size(); ++size) {
        for (Delivery delivery : c_deliveries)
            EXPECT_FALSE(Parse({b.bytes.begin(), b.bytes.begin() + static_cast<i64>(size)}, true, delivery)) << size;
    }
}

// The stream.

TEST(InSerialiserFileTest, StreamIsLeftJustBehindTheList)
{
    PropertyBytes const list = EveryItemForm();
    PropertyBytes b;
    b.Text("before").Append(list).Text("behind the list");
    for (Delivery delivery : c_deliveries) {
        Counted<InStream> const in = Deliver(b.bytes, delivery);
        char before[6];
        ASSERT_EQ(in->ReadBlock(before, 6), 6u);
        ASSERT_TRUE(InSerialiserFile::ParseWithChecks(*in));
        EXPECT_EQ(GetTaken(*in), 6 + list.bytes.size());
        char behind[16] = {};
        EXPECT_EQ(in->ReadBlock(behind, 15), 15u);
        EXPECT_STREQ(behind, "behind the list");
    }
}

TEST(InSerialiserFileTest, SkippingAndLookingLeaveTheStreamJustBehindTheListToo)
{
    PropertyBytes b;
    b.Header().Item(0x31, "Unkn").Object(0).RootClass("Xxxx").Append(EveryValueForm()).Item(0x2D, "Last").U32(1).U8(5);
    b.End().End();
    size_t const size = b.bytes.size();
    b.Text("behind");
    for (Delivery delivery : c_deliveries) {
        Counted<InStream> const skipped = Deliver(b.bytes, delivery);
        ASSERT_TRUE(InSerialiserFile::ParseSkipUnknownClasses(*skipped));
        EXPECT_EQ(GetTaken(*skipped), size);
        Counted<InStream> const looked = Deliver(b.bytes, delivery);
        PropertyStreamReport const report = CheckPropertyStream(*looked);
        ASSERT_TRUE(report.IsGood()) << report.reason.GetData();
        EXPECT_EQ(report.offset, size);
        EXPECT_EQ(GetTaken(*looked), size);
    }
}

TEST(InSerialiserFileTest, SmallPropertiesNeedFewReads)
{
    PropertyBytes b;
    b.Header();
    for (u32 i = 1; i <= 10000; ++i) b.U8(3).U32(i).U32(i);
    b.End();
    SeekableScriptedStream* const seekable = new SeekableScriptedStream(b.bytes);
    Counted<InStream> const keepSeekable(seekable);
    ASSERT_TRUE(InSerialiserFile::ParseWithChecks(*seekable));
    EXPECT_LE(seekable->reads, 3u);
    ScriptedInStream* const plain = new ScriptedInStream(b.bytes, false);
    Counted<InStream> const keepPlain(plain);
    ASSERT_TRUE(InSerialiserFile::ParseWithChecks(*plain));
    EXPECT_LE(plain->reads, 10000u + 5);
}

// Objects.

TEST(InSerialiserFileTest, ObjectThatHoldsItselfLoads)
{
    int const before = ReaderNode::s_alive;
    PropertyBytes b = BeginRoot();
    b.Item(0x31, "Chld").BackReference(0).Item(0x31, "Refr").BackReference(0).End().End();
    {
        Counted<InSerialiserFile> const file = Parse(b.bytes);
        ASSERT_TRUE(file);
        Counted<ReaderNode> const root = LoadRoot(*file);
        ASSERT_TRUE(root);
        EXPECT_EQ(root->child, root);
        EXPECT_TRUE(root->sawUnloaded);
        root->Drop();
    }
    EXPECT_EQ(ReaderNode::s_alive, before);
}

TEST(InSerialiserFileTest, LoadThatRefusesEndsTheParse)
{
    PropertyBytes b = BeginRoot();
    b.U32Item("Refu", 1).End().End();
    for (bool checks : {true, false}) {
        TraceCapture trace;
        try {
            Parse(b.bytes, checks);
            FAIL();
        } catch (UnknownClassUIDException const&) {
            FAIL();
        } catch (FutureVersionException const& e) {
            EXPECT_TRUE(e.WasRefused());
        }
        EXPECT_EQ(trace.GetText(), ">>> Failed to load object: RdNo\n");
    }
}

TEST(InSerialiserFileTest, ArrayElementOfAnotherClassIsRefused)
{
    PropertyBytes b = BeginRoot();
    b.Item(0xB1, "Kids").U32(1).Object(1).RootClass("RdLg").End().End().End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    ASSERT_TRUE(file); // RdLg is a RdNo.
    PropertyBytes shared = BeginRoot();
    shared.Item(0xB1, "Kids").U32(1).Object(1).RootClass("RdSh").U32Item("Numb", 1).End().End().End();
    EXPECT_THROW(Parse(shared.bytes), FutureVersionException);
}

TEST(InSerialiserFileTest, ClassThatMakesNoObjectGivesNull)
{
    constexpr char c_classes[][5] = {"RdAb", "RdNu"};
    for (auto const& uid : c_classes) {
        PropertyBytes b;
        b.Header().Item(0x31, "Root").Object(0).RootClass(uid).End().End();
        EXPECT_FALSE(Parse(b.bytes)) << uid;
        EXPECT_FALSE(Parse(b.bytes, false)) << uid;
    }
}

TEST(InSerialiserFileTest, EqualSharedObjectsBecomeOne)
{
    PropertyBytes b;
    b.Header().Item(0xB1, "Shrs").U32(3).Object(0).RootClass("RdSh").U32Item("Numb", 4001).End();
    b.Object(1).KnownClass("RdSh").U32Item("Numb", 4001).End().Object(2).KnownClass("RdSh").U32Item("Numb", 4002);
    b.End().End();
    Counted<InSerialiserFile> const first = Parse(b.bytes);
    Counted<InSerialiserFile> const second = Parse(b.bytes);
    std::vector<Consolidated<ReaderShared>> a;
    std::vector<Consolidated<ReaderShared>> again;
    ASSERT_TRUE(first && first->LoadSharedObjects("Shrs", a));
    ASSERT_TRUE(second && second->LoadSharedObjects("Shrs", again));
    EXPECT_TRUE(a[0] == a[1]);
    EXPECT_FALSE(a[0] == a[2]);
    EXPECT_TRUE(a[2] == again[2]);
    EXPECT_TRUE(a[0]->IsConsolidated());
}

TEST(InSerialiserFileTest, IndicesMayComeInAnyOrder)
{
    PropertyBytes b;
    b.Header().Item(0xB1, "Arry").U32(4);
    b.Object(0xFFFFFFFF).RootClass("RdNo").U32Item("Numb", 1).End();
    b.Object(7).KnownClass("RdNo").U32Item("Numb", 2).End();
    b.BackReference(0xFFFFFFFF).BackReference(7).End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    ASSERT_TRUE(file);
    std::vector<Counted<ReaderNode>> nodes;
    ASSERT_TRUE(file->LoadObjects("Arry", nodes));
    EXPECT_EQ(nodes[0], nodes[2]);
    EXPECT_EQ(nodes[1], nodes[3]);
    EXPECT_EQ(nodes[3]->number, 2u);
}

TEST(InSerialiserFileTest, ListKeptBeyondItsLoadIsEmpty)
{
    // Held by a class that breaks the rule, as the list of its first object.
    static Counted<InSerialiser const> s_kept;
    class Keeper : public ReaderNode
    {
    public:
        bool Load(InSerialiser const& in, FileStore& store, unsigned short v) override
        {
            if (!s_kept) s_kept = Counted<InSerialiser const>(&in);
            return ReaderNode::Load(in, store, v);
        }
    };
    static ClassProperties const s_class("RdKp", &ClassProperties::CreateNew<Keeper>, 1, nullptr, nullptr);
    static ClassPropertiesBase::Init const s_init(&s_class);
    PropertyBytes b;
    b.Header().Item(0xB1, "Arry").U32(2).Object(0).RootClass("RdKp").TextItem("Name", "one").End();
    b.Object(1).KnownClass("RdKp").TextItem("Name", "two").End().End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    std::vector<Counted<ReaderNode>> nodes;
    ASSERT_TRUE(file && file->LoadObjects("Arry", nodes));
    EXPECT_EQ(nodes[1]->name, "two");
    EXPECT_FALSE(s_kept->HasPropertyOrDefault("Name"));
    s_kept.Reset();
}

// Defaults.

TEST(InSerialiserFileTest, DefaultsComeFromTheFileThroughTheChain)
{
    PropertyBytes b;
    b.Header().Item(0x31, "Root").Object(0);
    b.U8(0).Code("RdDv").U16(1).TextItem("Name", "derived").End();
    b.U8(0).Code("RdNo").U16(6).TextItem("Name", "base").U32Item("Numb", 31).End().U8(2);
    b.End();
    b.Item(0x31, "Othr").Object(1).KnownClass("RdNo").U32Item("Numb", 32).End().End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    ASSERT_TRUE(file);
    Counted<ReaderNode> const root = LoadRoot(*file);
    ASSERT_TRUE(root);
    EXPECT_EQ(root->name, "derived");
    EXPECT_EQ(root->number, 31u);
    EXPECT_TRUE(root->numberIsDefault);
    EXPECT_EQ(root->version, 1);
    Counted<ReaderNode> other;
    ASSERT_TRUE(file->LoadObject("Othr", other));
    EXPECT_EQ(other->name, "base");
    EXPECT_EQ(other->number, 32u);
    EXPECT_FALSE(other->numberIsDefault);
    EXPECT_EQ(other->version, 6);
}

TEST(InSerialiserFileTest, ManyDefaultsOverManyClassesAreFound)
{
    PropertyBytes b;
    b.Header().Item(0x31, "Root").Object(0).U8(0).Code("RdDv").U16(1);
    for (u32 i = 2000; i > 1000; --i) b.U8(3).U32(i).U32(i);
    b.End().U8(0).Code("RdNo").U16(1);
    for (u32 i = 0; i < 1500; ++i) b.U8(3).U32(i + 1).U32(0);
    b.U32Item("Numb", 12).End().U8(2).End().End();
    Counted<InSerialiserFile> const file = Parse(b.bytes);
    ASSERT_TRUE(file);
    EXPECT_EQ(LoadRoot(*file)->number, 12u);
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
    struct
    {
        char const* what;
        char const (&uid)[5];
        char const* parent; // Null: none. Described as a root class.
        char const* trace;
    } const cases[] = {
        {"none, none", "RdNo", nullptr, ""},
        {"none, unknown", "RdNo", "Xxxx",
         ">>> Unknown class: Xxxx\n>>> Unexpected parent class for RdNo:  Unknown (see above)\n"},
        {"none, known", "RdNo", "RdDv", ">>> Unexpected parent class for RdNo:  Found RdDv\n"},
        {"class, none", "RdDv", nullptr, ""},
        {"class, unknown", "RdDv", "Xxxx",
         ">>> Unknown class: Xxxx\n>>> Missing parent class for RdDv:  Expected RdNo\n"},
        {"class, another", "RdDv", "RdLg", ">>> Incorrect parent class for RdDv:  Found RdLg  Expected RdNo\n"},
        {"class, same", "RdDv", "RdNo", ""},
        {"legacy", "RdLg", "RdNo", ""},
    };
    for (auto const& c : cases) {
        SCOPED_TRACE(c.what);
        PropertyBytes b;
        b.Header().Item(0x31, "Root").Object(0).U8(0).Code(c.uid).U16(1).U32Item("Numb", 2).End();
        if (c.parent) {
            char code[5] = {};
            std::memcpy(code, c.parent, 4);
            b.U8(0).Code(code).U16(1).TextItem("Name", "of the parent").End();
        }
        b.U8(2).End().End();
        TraceCapture trace;
        Counted<InSerialiserFile> const file = Parse(b.bytes, false);
        ASSERT_TRUE(file);
        EXPECT_EQ(trace.GetText(), c.trace);
        Counted<ReaderNode> const root = LoadRoot(*file);
        ASSERT_TRUE(root);
        bool const hasParent = c.parent && std::string_view(c.parent) != "Xxxx";
        EXPECT_EQ(root->name, hasParent ? "of the parent" : ""); // The chain is the file's.
    }
}

// Unknown classes.

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

TEST(InSerialiserFileTest, UnknownClassIsToldByAParseWithChecks)
{
    try {
        PropertyBytes b;
        b.Header().Item(0x31, "Unkn").Object(0).RootClass("Xxxx").End().End();
        Parse(b.bytes);
        FAIL();
    } catch (FutureVersionException const& e) {
        EXPECT_FALSE(e.WasRefused());
        auto const* const unknown = dynamic_cast<UnknownClassUIDException const*>(&e);
        ASSERT_TRUE(unknown);
        EXPECT_EQ(unknown->GetClassUID(), ClassUID("Xxxx"));
    }
}

TEST(InSerialiserFileTest, ReferenceToASkippedObjectGivesNull)
{
    PropertyBytes b;
    b.Header().Item(0x31, "Unkn").Object(0).RootClass("Xxxx").End().Item(0x31, "Refr").BackReference(0).End();
    EXPECT_FALSE(Parse(b.bytes, false));
    PropertyBytes inside;
    inside.Header().Item(0x31, "Unkn").Object(0).RootClass("Xxxx");
    inside.Item(0x31, "Chld").Object(1).RootClass("RdNo").End().End().Item(0x31, "Refr").BackReference(1).End();
    EXPECT_FALSE(Parse(inside.bytes, false));
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
    // Loads its child as a reference and keeps nothing.
    class Dropper : public ReaderNode
    {
    public:
        bool Load(InSerialiser const& in, FileStore&, unsigned short) override
        {
            Counted<ReaderNode> dropped;
            return in.LoadObject("Chld", dropped, false) && dropped->number == 3;
        }
    };
    static ClassProperties const s_class("RdDr", &ClassProperties::CreateNew<Dropper>, 1, nullptr, nullptr);
    static ClassPropertiesBase::Init const s_init(&s_class);
    PropertyBytes b;
    b.Header().Item(0x31, "Root").Object(0).RootClass("RdDr");
    b.Item(0x31, "Chld").Object(1).RootClass("RdNo").U32Item("Numb", 3).End();
    b.Item(0x31, "Nevr").Object(2).KnownClass("RdNo").U32Item("Numb", 4).End();
    b.End().Item(0x31, "Shar").Object(3).RootClass("RdSh").U32Item("Numb", 1).End().End();
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
