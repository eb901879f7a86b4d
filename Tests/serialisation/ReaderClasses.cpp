#include "serialisation/ReaderClasses.h"

#include "libkernel/core/Hash.h"
#include "libkernel/streams/MemoryStreams.h"
#include "support/ScriptedInStream.h"

namespace Kernel::Test {

namespace {

Counted<Serialisable> MakeNull()
{
    return nullptr;
}

Counted<Serialisable> MakeLegacy(InSerialiser const& in, unsigned short)
{
    u32 number = 0;
    in.LoadType("Numb", number);
    return Counted<Serialisable>(new ReaderLegacy(number));
}

ClassProperties const s_abstract("RdAb", static_cast<ClassProperties::CreateFunc>(nullptr), 0, nullptr, nullptr);
ClassProperties const s_making_null("RdNu", &MakeNull, 1, nullptr, nullptr);
} // namespace

ClassProperties const ReaderNode::ms_ClassProperties("RdNo", &ClassProperties::CreateNew<ReaderNode>, 1, nullptr,
                                                     nullptr);
int ReaderNode::s_alive = 0;
std::set<ReaderNode*> ReaderNode::s_all;
ClassProperties const ReaderDerived::ms_ClassProperties("RdDv", &ClassProperties::CreateNew<ReaderDerived>, 1, nullptr,
                                                        &ReaderNode::ms_ClassProperties);
ClassProperties const ReaderLegacy::ms_ClassProperties("RdLg", &MakeLegacy, 1);
SharedClassProperties const ReaderShared::ms_ClassProperties("RdSh", &SharedClassProperties::CreateNew<ReaderShared>, 1,
                                                             nullptr, nullptr);
bool ReaderShared::s_hashesAlike = false;

namespace {

// Behind the descriptions, which have to be there.
ClassPropertiesBase::Init const s_inits[] = {ClassPropertiesBase::Init(&s_abstract),
                                             ClassPropertiesBase::Init(&s_making_null),
                                             ClassPropertiesBase::Init(&ReaderNode::ms_ClassProperties),
                                             ClassPropertiesBase::Init(&ReaderDerived::ms_ClassProperties),
                                             ClassPropertiesBase::Init(&ReaderLegacy::ms_ClassProperties),
                                             ClassPropertiesBase::Init(&ReaderShared::ms_ClassProperties)};

} // namespace

void ReaderNode::Save(OutSerialiser& out) const
{
    out.SaveType("Numb", number);
    out.SaveType("Name", name);
    out.SaveObject("Chld", child);
    out.SaveObject("Refr", reference, false);
    out.SaveObjects("Kids", kids);
    out.SaveSharedObject("Shrd", shared);
}

bool ReaderNode::Load(InSerialiser const& in, FileStore&, unsigned short v)
{
    version = v;
    in.LoadType("Numb", number);
    numberIsDefault = !in.HasProperty("Numb") && in.HasPropertyOrDefault("Numb");
    in.LoadType("Name", name);
    in.LoadObject("Chld", child);
    in.LoadObject("Refr", reference, false);
    tookWrongClass = in.HasProperty("Kids") && !in.LoadObjects("Kids", kids);
    in.LoadSharedObject("Shrd", shared);
    if (auto const* const node = dynamic_cast<ReaderNode const*>(reference.Get())) sawUnloaded = !node->isLoaded;
    isLoaded = true;
    return !in.HasProperty("Refu") && !tookWrongClass;
}

ReaderNode::ReaderNode()
{
    ++s_alive;
    s_all.insert(this);
}

ReaderNode::~ReaderNode()
{
    --s_alive;
    s_all.erase(this);
}

void ReaderNode::DropAll()
{
    std::vector<Counted<ReaderNode>> const all(s_all.begin(), s_all.end());
    for (Counted<ReaderNode> const& node : all) node->Drop();
}

void ReaderNode::Drop()
{
    child.Reset();
    reference.Reset();
    kids.clear();
}

void ReaderShared::Save(OutSerialiser& out) const
{
    out.SaveType("Numb", number);
    out.SaveSharedObject("Next", next);
}

bool ReaderShared::Load(InSerialiser const& in, FileStore&, unsigned short)
{
    in.LoadSharedObject("Next", next);
    return in.LoadType("Numb", number);
}

void ReaderShared::AccumulateHash(HashAccumulator& hash) const
{
    if (!s_hashesAlike) hash.AddToHash(&number, sizeof(number));
}

bool ReaderShared::CompareMembers(SharedSerialisable const& other, CompareContext const&) const
{
    auto const& o = static_cast<ReaderShared const&>(other);
    return number == o.number && next == o.next;
}

Counted<InStream> Deliver(std::vector<u8> const& bytes, Delivery delivery)
{
    switch (delivery) {
    case Delivery::Memory: return Counted<InStream>(new MemoryInStream(bytes.data(), bytes.size(), true));
    case Delivery::Seekable: return Counted<InStream>(new SeekableScriptedStream(bytes));
    case Delivery::Sized: return Counted<InStream>(new ScriptedInStream(bytes, true));
    case Delivery::Unsized: break;
    }
    return Counted<InStream>(new ScriptedInStream(bytes, false));
}

u64 GetTaken(InStream const& in)
{
    auto const* const scripted = dynamic_cast<ScriptedInStream const*>(&in);
    return scripted ? scripted->GetPosition() : in.Tell();
}

Counted<InSerialiserFile> Parse(std::vector<u8> const& bytes, bool checks, Delivery delivery)
{
    Counted<InStream> const in = Deliver(bytes, delivery);
    return checks ? InSerialiserFile::ParseWithChecks(*in) : InSerialiserFile::ParseSkipUnknownClasses(*in);
}

PropertyBytes EveryValueForm(bool everySize)
{
    PropertyBytes b;
    // Fixed sizes, alone and as arrays of two.
    for (int type = 1; type <= 116; ++type) {
        u32 const size = c_propSizes[static_cast<size_t>(type)];
        if (size == 0 || type == 41 || (!everySize && type > 10 && type % 9 != 0)) continue;
        b.U8(static_cast<u8>(type)).U32(0x10000 + static_cast<u32>(type));
        for (u32 i = 0; i < size; ++i) b.U8(static_cast<u8>(i + 1));
        b.U8(static_cast<u8>(type | 0x80)).U32(0x20000 + static_cast<u32>(type)).U32(2).Zeros(2 * size);
    }
    b.Item(0x29, "Bool").U8(1);
    b.Item(0xA9, "Bits").U32(11).U8(0x05).U8(0x04);
    b.Item(0x2A, "Enum").U16(2).U16(0);
    b.Item(0xAA, "Enms").U32(3).U16(0).U16(2).U16(0).U16(1);
    b.TextItem("Text", "na\xC3\xAFve");
    b.Item(0xAB, "Txts").U32(4 + 2 + 4 + 0).U32(2).U32(2).Text("ab").U32(0);
    b.Item(0x2E, "Shpd").U32(2).Text("xy");
    b.Item(0xAE, "Shps").U32(5).U32(1).U32(1).Text("z");
    b.Item(0x2C, "Cust").U16(3).Raw({1, 2, 3});
    b.Item(0xAC, "Csts").U32(2).U16(3).Raw({1, 2, 3, 4, 5, 6});
    b.Item(0x2D, "Data").U32(5).Raw({9, 8, 7, 6, 5});
    b.Item(0x77, "Algn").U32(3).U16(2).Raw({0, 0, 1, 2, 3});
    b.Item(0x76, "Frag").U32(4).U32(65536).Raw({4, 3, 2, 1});
    b.Item(0x75, "Flag").U16(0).U8(2).Raw({0x18, 0x01});
    b.Item(0x30, "Strm").U16(7);
    b.U8(3).U32(42).U8(0x8A).U32(1).F64(2.5).U8(0x29).U8(1).U8(0xA9).U32(9).U8(0xFF).U8(1);
    b.U8(0x2A).U16(1).U16(0).U8(0xAA).U32(1).U16(0).U16(2).U8(0x2B).U32(2).Text("hi");
    b.U8(0xAB).U32(5).U32(1).U32(1).Text("q").U8(0x2C).U16(2).Raw({1, 2}).U8(0xAC).U32(1).U16(2).Raw({3, 4});
    b.U8(0x2D).U32(3).Raw({7, 7, 7}).U8(0x35).U8(1).U8(0xB5).U32(2).Raw({1, 2}).End();
    b.Item(0x32, "Clas").U8(1).Code("InRg").U16(1).U32Item("Frst", 5).End();
    b.Item(0x32, "ClsN").U8(0);
    b.Item(0xB2, "Clss").U32(3).Code("InRg").U16(1).U8(1).U32Item("Frst", 6).End().U8(0).U8(1).End();
    b.Item(0x33, "DlyN").U32(0).U32(0);
    b.Item(0x33, "DlyZ").U32(0).U32(4).Text("path");
    return b;
}

PropertyBytes EveryItemForm(bool everySize)
{
    PropertyBytes b;
    b.Header().Append(EveryValueForm(everySize));
    // A class with every kind of default, its parent, objects in objects, arrays and references.
    b.Item(0x31, "Root").Object(0).U8(0).Code("RdDv").U16(1);
    b.U32Item("DfT1", 11).Item(0x83, "DfT2").U32(2).U32(1).U32(2).TextItem("Name", "default name");
    b.Item(0x2C, "DfC1").U16(2).Raw({1, 2}).Item(0xAC, "DfC2").U32(1).U16(2).Raw({3, 4});
    b.Item(0x2A, "DfE1").U16(0).U16(0).Item(0xAA, "DfE2").U32(1).U16(0).U16(0).Item(0x75, "DfFl").U16(0).U8(1).U8(3);
    b.Item(0x31, "Shrd").Object(1).RootClass("RdSh").U32Item("Numb", 5).End();
    b.Item(0xB1, "DfSA").U32(2).U8(0).BackReference(1).End();
    b.RootClass("RdNo", 2);
    b.U32Item("Numb", 100);
    b.Item(0x31, "Chld").Object(2).KnownClass("RdNo").TextItem("Name", "child").End();
    b.Item(0x31, "Refr").BackReference(2);
    b.Item(0xB1, "Kids").U32(3).U8(0).Object(3).KnownClass("RdNo").End().BackReference(2).End();
    b.Item(0x31, "NulO").U8(0);
    b.Item(0xB1, "NulA").U32(4).Raw({0, 0, 0, 0});
    b.Item(0x31, "Shar")
        .Object(0xFFFFFFFF)
        .KnownClass("RdSh")
        .U32Item("Numb", 6)
        .Item(0x31, "Next")
        .BackReference(1)
        .End();
    b.Item(0xB1, "Shrs").U32(2).BackReference(0xFFFFFFFF).BackReference(1);
    b.Item(0x31, "Lgcy").Object(7).RootClass("RdLg").U32Item("Numb", 77).End();
    return b.End();
}

} // namespace Kernel::Test
