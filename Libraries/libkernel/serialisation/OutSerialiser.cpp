#include "libkernel/serialisation/OutSerialiser.h"

#include "libkernel/core/CheckedMath.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/Endian.h"
#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/core/RawData.h"
#include "libkernel/filestore/FileStoreOut.h"
#include "libkernel/serialisation/ClassProperties.h"
#include "libkernel/serialisation/OutSerialiserObjectList.h"
#include "libkernel/serialisation/OutSerialiserTarget.h"
#include "libkernel/serialisation/internal/DefaultTable.h"
#include "libkernel/serialisation/internal/OutSerialiserInline.h"
#include "libkernel/serialisation/internal/PropWriter.h"

#include <algorithm>
#include <bit>
#include <limits>

namespace Kernel {

// Numbers, structs and arrays go to the file as they lie in memory.
static_assert(std::endian::native == std::endian::little);

namespace {

// Most texts are short, and a call costs more than their bytes.
bool IsSameText(std::string_view a, std::string_view b)
{
    size_t const length = a.size();
    if (length != b.size()) return false;
    if (length < 4 || length > 8) return a == b;
    size_t const last = length - 4;
    return LoadLittleEndian<u32>(a.data()) == LoadLittleEndian<u32>(b.data()) &&
           LoadLittleEndian<u32>(a.data() + last) == LoadLittleEndian<u32>(b.data() + last);
}

bool CompareBools(Defaults::DefaultTypeArray const& item, bool const* values, u64 count)
{
    return item.Compare(values, count);
}

bool CompareBools(Defaults::DefaultTypeArray const& item, std::vector<bool> const& values, u64)
{
    return item.Compare(values);
}

// Stands for the flag of a store that has none.
bool s_neverAborted = false;

// Small enough to be compiled into each operation.
template <class Test>
bool IsDefault(DefaultRow const* row, Test const& test)
{
    return row && test(*row);
}

} // namespace

OutSerialiser::SaveException::~SaveException() = default;

OutSerialiser::Advice const OutSerialiser::s_noAdvice;

OutSerialiserStep const OutSerialiser::s_noStep;

OutSerialiser::OutSerialiser(OutSerialiserTarget& target, FileStoreOut& store, OutSerialiserObjectList& objects)
    : m_target(target), m_store(store), m_objects(objects), m_step(&s_noStep), m_firstStep(nullptr),
      m_abort(store.GetAbortFlag() ? store.GetAbortFlag() : &s_neverAborted), m_class(nullptr), m_advice(&s_noAdvice),
      m_obstacles(store.IsFullSave() ? 0 : Enumerating), m_isFileLevel(true)
{
}

OutSerialiser::OutSerialiser(OutSerialiser& parent, ClassPropertiesBase const* description)
    : m_target(parent.m_target), m_store(parent.m_store), m_objects(parent.m_objects), m_step(&s_noStep),
      m_firstStep(nullptr), m_abort(parent.m_abort),
      m_class(description ? &parent.m_objects.GetClass(*description) : nullptr), m_advice(parent.m_advice),
      m_obstacles(parent.m_obstacles & Enumerating), m_isFileLevel(false)
{
    if (description) return;
    m_level.emplace();
    if (!m_level->IsAllowed()) Fail(SaveException::Misuse);
}

OutSerialiser::~OutSerialiser() = default;

void OutSerialiser::Fail(int code, SourceLocation where) const
{
    if (code == SaveException::ShortWrite) m_objects.MarkAsHandlingException();
    throw SaveException(where.file, where.line, code);
}

int OutSerialiser::CheckLengthI(u64 length) const
{
    if (length > static_cast<u64>(std::numeric_limits<int>::max())) Fail(SaveException::TooLarge);
    return static_cast<int>(length);
}

DefaultRow const* OutSerialiser::StartOutOfSequenceI(IDTag tag)
{
    if (m_firstStep) {
        for (auto const* used = m_firstStep; used != m_step; ++used) m_usedTags.Add(IDTag(static_cast<u32>(used->tag)));
        m_firstStep = nullptr;
        m_step = &s_noStep;
    }
    if (!m_usedTags.Add(tag)) Fail(SaveException::TagOrChild);
    return FindDefaultI(tag);
}

bool OutSerialiser::HasProperty(IDTag tag) const
{
    if (!m_firstStep) return m_usedTags.Contains(tag);
    return std::any_of(m_firstStep, m_step, [&](OutSerialiserStep const& used) { return used.tag == tag.value; });
}

void OutSerialiser::AbortI()
{
    m_store.SetAborted();
    throw AbortException();
}

void OutSerialiser::SaveAnyScalarI(IDTag tag, PropType type, u64 bits, u32 size)
{
    if (!IsFullSave()) return;
    DefaultRow const* const row = StartI(tag);
    if (row && row->EqualsScalar(type, bits, size)) return;
    if (!m_target.Reserve(c_scalarRoom)) Fail(SaveException::ShortWrite);
    PutScalarI(tag, type, bits, size);
}

void OutSerialiser::SaveTypeI(IDTag tag, PropType type, void const* value, u64 size)
{
    if (!IsFullSave()) return;
    u8 const number = static_cast<u8>(type);
    bool const isSound = size != 0 && number < c_propTypeCount && c_propSizes[number] == size;
    if (isSound && size <= sizeof(u64)) {
        u64 bits = 0;
        std::memcpy(&bits, value, size);
        return SaveScalarI(tag, type, bits, static_cast<u32>(size));
    }
    DefaultRow const* const found = StartI(tag);
    if (!isSound) Fail(SaveException::Misuse);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultType>();
        return item && item->Compare(type, value, size);
    };
    if (!IsDefault(found, equals)) std::memcpy(PutHeaderI(tag, number, size), value, size);
}

void OutSerialiser::SaveTypeArrayI(IDTag tag, PropType type, void const* values, u64 unitSize, u64 count)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    u8 const number = static_cast<u8>(type);
    bool const isPacked = type == PropType::Bool;
    if (unitSize == 0 || number >= c_propTypeCount || c_propSizes[number] != unitSize || isPacked)
        Fail(SaveException::Misuse);
    u32 const stored = CheckCountI(count);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultTypeArray>();
        return item && item->Compare(type, values, unitSize, count);
    };
    if (IsDefault(found, equals)) return;
    StoreLittleEndian(PutHeaderI(tag, number | c_propArrayBit, 4), stored);
    PutI(values, unitSize * count);
}

void OutSerialiser::SaveBoolI(IDTag tag, bool value)
{
    SaveScalarI(tag, PropType::Bool, value ? 1 : 0, 1);
}

template <class Bools>
void OutSerialiser::SaveBoolsI(IDTag tag, Bools const& values, u64 count)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    CheckCountI(count);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultTypeArray>();
        return item && CompareBools(*item, values, count);
    };
    if (IsDefault(found, equals)) return;
    PutHeaderI(tag, static_cast<u8>(PropType::Bool) | c_propArrayBit, 0);
    PropWriter(*this).PutBools(values, count);
}

void OutSerialiser::SaveTypes(IDTag tag, bool const* values, u64 count)
{
    SaveBoolsI(tag, values, count);
}

void OutSerialiser::SaveTypes(IDTag tag, std::vector<bool> const& values)
{
    SaveBoolsI(tag, values, values.size());
}

void OutSerialiser::SaveTypes(IDTag tag, std::deque<bool> const& values)
{
    SaveTypes(tag, std::vector<bool>(values.begin(), values.end()));
}

void OutSerialiser::SaveType(IDTag tag, String16 const& text)
{
    if (IsFullSave()) SaveType(tag, ConvertedTo<TEncUtf8>(text));
}

void OutSerialiser::SaveType(IDTag tag, String32 const& text)
{
    if (IsFullSave()) SaveType(tag, ConvertedTo<TEncUtf8>(text));
}

void OutSerialiser::SaveStringI(IDTag tag, char const* utf8, u64 length)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    u32 const stored = CheckCountI(length);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultString>();
        return item && IsSameText(item->GetText().GetView(), {utf8, length});
    };
    if (IsDefault(found, equals)) return;
    StoreLittleEndian(PutHeaderI(tag, static_cast<u8>(PropType::String), 4), stored);
    PutI(utf8, length);
}

void OutSerialiser::SaveTypes(IDTag tag, String8 const* texts, u64 count)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultStringArray>();
        return item && item->Compare(texts, count);
    };
    if (IsDefault(found, equals)) return;
    PropWriter writer(*this);
    u32 const total = writer.CheckTexts(texts, count);
    PutHeaderI(tag, static_cast<u8>(PropType::String) | c_propArrayBit, 0);
    writer.PutTexts(texts, count, total);
}

template <class Enc>
void OutSerialiser::SaveForeignTextsI(IDTag tag, StringT<Enc> const* texts, u64 count)
{
    if (IsFullSave()) SaveTypes(tag, PropWriter::ConvertTexts(texts, count).data(), count);
}

void OutSerialiser::SaveTypes(IDTag tag, String16 const* texts, u64 count)
{
    SaveForeignTextsI(tag, texts, count);
}

void OutSerialiser::SaveTypes(IDTag tag, String32 const* texts, u64 count)
{
    SaveForeignTextsI(tag, texts, count);
}

void OutSerialiser::SavePropertyStructI(IDTag tag, void const* value, u64 size)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultCustom>();
        return item && item->Compare(value, size);
    };
    if (IsDefault(found, equals)) return;
    u16 const stored = CheckShortI(size);
    StoreLittleEndian(PutHeaderI(tag, static_cast<u8>(PropType::Custom), 2), stored);
    PutI(value, size);
}

void OutSerialiser::SavePropertyStructArrayI(IDTag tag, void const* values, u64 unitSize, u64 count)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    u32 const storedCount = CheckCountI(count);
    u16 const storedSize = CheckShortI(unitSize);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultCustomArray>();
        return item && item->Compare(values, unitSize, count);
    };
    if (IsDefault(found, equals)) return;
    u8* const header = PutHeaderI(tag, static_cast<u8>(PropType::Custom) | c_propArrayBit, 6);
    StoreLittleEndian(header, storedCount);
    StoreLittleEndian(header + 4, storedSize);
    PutI(values, unitSize * count);
}

void OutSerialiser::SaveRawStructI(IDTag tag, void const* value, u64 size)
{
    if (size < 1 || size > c_maxRawStructSize) Fail(SaveException::TooLarge);
    if (!IsFullSave()) return;
    StartI(tag);
    std::memcpy(PutHeaderI(tag, static_cast<u8>(RawStructType(size)), size), value, size);
}

void OutSerialiser::SaveRawData(IDTag tag, void const* bytes, u64 size)
{
    if (!IsFullSave()) return;
    StartI(tag);
    PutRawDataI(tag, bytes, size);
}

void OutSerialiser::PutRawDataI(IDTag tag, void const* bytes, u64 size)
{
    u32 const stored = CheckCountI(size);
    StoreLittleEndian(PutHeaderI(tag, static_cast<u8>(PropType::RawData), 4), stored);
    PutI(bytes, size);
}

void OutSerialiser::SaveAlignedRawData(IDTag tag, void const* bytes, u64 size, u64 alignment)
{
    if (!IsFullSave()) return;
    StartI(tag);
    if (alignment > c_maxDataAlignment) Fail(SaveException::Misuse);
    u64 const position = m_target.GetSize();
    if (alignment < 2 || (position + c_rawDataHeaderSize) % alignment == 0) return PutRawDataI(tag, bytes, size);
    u32 const stored = CheckCountI(size);
    u64 const remainder = (position + c_alignedRawDataHeaderSize) % alignment;
    u16 const pad = static_cast<u16>(remainder ? alignment - remainder : 0);
    u8* const header = PutHeaderI(tag, static_cast<u8>(PropType::AlignedRawData), 6 + pad);
    StoreLittleEndian(header, stored);
    StoreLittleEndian(header + 4, pad);
    std::memset(header + 6, 0, pad);
    PutI(bytes, size);
}

void OutSerialiser::SaveAlignedRawData(IDTag tag, RawDataT<VoidClass, AllocatorMalloc> const& bytes, u64 alignment)
{
    SaveAlignedRawData(tag, bytes.GetData(), bytes.GetSize(), alignment);
}

void OutSerialiser::SaveFragmentedRawData(IDTag tag, FragmentedRawData const& bytes)
{
    if (!IsFullSave()) return;
    StartI(tag);
    u32 const size = CheckCountI(bytes.GetSize());
    u32 const blockSize = CheckCountI(bytes.GetBlockSize());
    u8* const header = PutHeaderI(tag, static_cast<u8>(PropType::FragmentedRawData), 8);
    StoreLittleEndian(header, size);
    StoreLittleEndian(header + 4, blockSize);
    OutStream* const stream = m_target.GetFlushedStream();
    if (stream && bytes.CopyToStream(*stream)) return;
    m_target.MarkAsFailed();
    Fail(SaveException::ShortWrite);
}

void OutSerialiser::SaveEnumI(IDTag tag, EnumSerialiser const& serialiser, int value)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    unsigned short code = 0;
    unsigned short version = 0;
    if (!serialiser.EncodeToSerial(value, code, version)) Fail(SaveException::NoEncoding);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultEnum>();
        return item && item->Compare(code, version);
    };
    if (IsDefault(found, equals)) return;
    u8* const to = PutHeaderI(tag, static_cast<u8>(PropType::Enum), 4);
    StoreLittleEndian(to, code);
    StoreLittleEndian(to + 2, version);
}

void OutSerialiser::SaveEnumsI(IDTag tag, EnumSerialiser const& serialiser, int const* values, u64 count)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    u32 const storedCount = CheckCountI(count);
    std::vector<unsigned short> codes;
    unsigned short version = 0;
    if (!serialiser.EncodeToSerial(values, count, codes, version)) Fail(SaveException::NoEncoding);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultEnumArray>();
        return item && item->Compare(codes.data(), count, version);
    };
    if (IsDefault(found, equals)) return;
    u8* const header = PutHeaderI(tag, static_cast<u8>(PropType::Enum) | c_propArrayBit, 6);
    StoreLittleEndian(header, storedCount);
    StoreLittleEndian(header + 4, version);
    PutI(codes.data(), codes.size() * sizeof(u16));
}

void OutSerialiser::SaveFlagSetI(IDTag tag, FlagSerialiser const& serialiser, u64 flags, unsigned char)
{
    if (!IsFullSave()) return;
    DefaultRow const* const found = StartI(tag);
    u64 encoded = 0;
    unsigned short version = 0;
    if (!serialiser.EncodeToSerial(flags, encoded, version)) Fail(SaveException::NoEncoding);
    auto const equals = [&](DefaultRow const& row) {
        auto const* const item = row.As<Defaults::DefaultFlagSet>();
        return item && item->Compare(encoded, version);
    };
    if (!IsDefault(found, equals)) PutFlagSetI(tag, encoded, version, FlagSerialiser::GetStoredBytes(encoded));
}

void OutSerialiser::PutFlagSetI(IDTag tag, u64 encoded, u16 version, u8 bytes)
{
    u8* const to = PutHeaderI(tag, static_cast<u8>(PropType::FlagSet), 3 + bytes);
    StoreLittleEndian(to, version);
    to[2] = bytes;
    std::memcpy(to + 3, &encoded, bytes);
}

void OutSerialiser::Close()
{
    if (IsClosed()) return;
    if (HaveChildActive()) Fail(SaveException::TagOrChild);
    if (IsFullSave()) {
        *ClaimI(1) = 0;
        if (m_isFileLevel && !m_target.Flush()) Fail(SaveException::ShortWrite);
    }
    if (m_class && !m_firstStep) m_objects.Learn(*m_class, m_usedTags.GetShort());
    m_obstacles |= Closed;
}

void OutSerialiser::AddProlongedObject(Counted<Countable const> object)
{
    if (!m_store.AddProlongedObject(object)) m_objects.KeepAlive(object);
}

OutSerialiser::Advice& OutSerialiser::GetOwnAdvice()
{
    if (!m_ownAdvice) {
        m_ownAdvice = std::make_unique<Advice>(*m_advice);
        m_advice = m_ownAdvice.get();
    }
    return *m_ownAdvice;
}

void OutSerialiser::SetFilePath(String8 const& path)
{
    GetOwnAdvice().path = path;
}

void OutSerialiser::PushStrategy(Counted<SerialisationStrategy const> const& strategy)
{
    GetOwnAdvice().strategies.push_back(strategy);
}

void OutSerialiser::PopStrategy()
{
    if (!m_advice->strategies.empty()) GetOwnAdvice().strategies.pop_back();
}

void OutSerialiser::InitStrategies(std::vector<Counted<SerialisationStrategy const>> const& strategies)
{
    GetOwnAdvice().strategies = strategies;
}

SerialisationStrategySession::SerialisationStrategySession(OutSerialiser& out,
                                                           Counted<SerialisationStrategy const> strategy)
    : m_out(strategy ? &out : nullptr)
{
    if (m_out) m_out->PushStrategy(strategy);
}

SerialisationStrategySession::~SerialisationStrategySession()
{
    if (m_out) m_out->PopStrategy();
}

} // namespace Kernel
