#include "serialisation/ReaderClasses.h"

#include "libkernel/core/Hash.h"
#include "libkernel/streams/MemoryStreams.h"
#include "support/PlainStreams.h"

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
    if (delivery == Delivery::Memory) return Counted<InStream>(new MemoryInStream(bytes.data(), bytes.size(), true));
    if (delivery == Delivery::Seekable) return Counted<InStream>(new SeekableSource(bytes));
    auto const source = MakeCounted<PlainSource>(bytes);
    source->sized = delivery == Delivery::Sized;
    return source;
}

Counted<InSerialiserFile> Parse(std::vector<u8> const& bytes, bool checks, Delivery delivery)
{
    Counted<InStream> const in = Deliver(bytes, delivery);
    return checks ? InSerialiserFile::ParseWithChecks(*in) : InSerialiserFile::ParseSkipUnknownClasses(*in);
}

Counted<InSerialiserFile> ParseItems(std::string_view notation)
{
    return Parse(PropertyBytes().Header().Put(notation).End().bytes);
}

PropertyBytes EveryValueForm()
{
    PropertyBytes b;
    // Fixed sizes, alone and as arrays of two.
    for (int type = 1; type <= 116; ++type) {
        u32 const size = c_propSizes[static_cast<size_t>(type)];
        if (size == 0 || type == 41) continue;
        b.U8(static_cast<u8>(type)).U32(0x10000 + static_cast<u32>(type));
        for (u32 i = 0; i < size; ++i) b.U8(static_cast<u8>(i + 1));
        b.U8(static_cast<u8>(type | 0x80)).U32(0x20000 + static_cast<u32>(type)).U32(2).Zeros(2 * size);
    }
    return b.Put("29 [Bool] 01 | A9 [Bits] 0B000000 0504 | 2A [Enum] 0200 0000 | AA [Enms] 03000000 0000 0200 0000 0100"
                 "2B [Text] 06000000 'na' C3AF 've' | AB [Txts] 0A000000 02000000 02000000 'ab' 00000000"
                 "2E [Shpd] 02000000 'xy' | AE [Shps] 05000000 01000000 01000000 'z'"
                 "2C [Cust] 0300 010203 | AC [Csts] 02000000 0300 010203040506 | 2D [Data] 05000000 0908070605"
                 "77 [Algn] 03000000 0200 0000 010203 | 76 [Frag] 04000000 00000100 04030201 | 75 [Flag] 0000 02 1801"
                 "30 [Strm] 0700 | 03 2A000000 | 8A 01000000 0000000000000440 | 29 01 | A9 09000000 FF01 | 2A 0100 0000"
                 "AA 01000000 0000 0200 | 2B 02000000 'hi' | AB 05000000 01000000 01000000 'q' | 2C 0200 0102"
                 "AC 01000000 0200 0304 | 2D 03000000 070707 | 35 01 | B5 02000000 0102 | 00"
                 "32 [Clas] 01 [InRg] 0100 | 03 [Frst] 05000000 00 | 32 [ClsN] 00"
                 "B2 [Clss] 03000000 [InRg] 0100 | 01 03 [Frst] 06000000 00 | 00 | 01 00"
                 "33 [DlyN] 00000000 00000000 | 33 [DlyZ] 00000000 04000000 'path'");
}

PropertyBytes EveryItemForm()
{
    PropertyBytes b;
    b.Header().Append(EveryValueForm());
    // A class with every kind of default, its parent, objects in objects, arrays and references.
    return b.Put(
        "31 [Root] 01 00000000 | 00 [RdDv] 0100 | 03 [DfT1] 0B000000 | 83 [DfT2] 02000000 01000000 02000000"
        "2B [Name] 0C000000 'default name' | 2C [DfC1] 0200 0102 | AC [DfC2] 01000000 0200 0304 | 2A [DfE1] 0000 0000"
        "AA [DfE2] 01000000 0000 0000 | 75 [DfFl] 0000 01 03"
        "31 [Shrd] 01 01000000 00 [RdSh] 0100 00 02 | 03 [Numb] 05000000 00 | B1 [DfSA] 02000000 00 02 01000000 | 00"
        "00 [RdNo] 0200 00 02 | 03 [Numb] 64000000 | 31 [Chld] 01 02000000 01 [RdNo] 2B [Name] 05000000 'child' 00"
        "31 [Refr] 02 02000000 | B1 [Kids] 03000000 00 01 03000000 01 [RdNo] 00 02 02000000 | 00"
        "31 [NulO] 00 | B1 [NulA] 04000000 00000000"
        "31 [Shar] 01 FFFFFFFF 01 [RdSh] 03 [Numb] 06000000 31 [Next] 02 01000000 00"
        "B1 [Shrs] 02000000 02 FFFFFFFF 02 01000000"
        "31 [Lgcy] 01 07000000 00 [RdLg] 0100 00 02 03 [Numb] 4D000000 00 | 00");
}

} // namespace Kernel::Test
