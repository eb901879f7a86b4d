#include "libkernel/serialisation/internal/InSerialiserLoader.h"

#include "libkernel/core/Format.h"
#include "libkernel/core/Limits.h"
#include "libkernel/core/Trace.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStore.h"
#include "libkernel/filestore/FileStoreItemType.h"
#include "libkernel/serialisation/FutureVersionException.h"

#include <algorithm>
#include <climits>

namespace Kernel {

namespace {

// Longer texts are read straight into a string of their own, which those who ask for them share.
constexpr u32 c_ownTextLength = 1024;

// The ends of an object of some 100 bytes: the table pointer in front, and the count, which a virtual base has behind.
void Prefetch(void const* object)
{
    __builtin_prefetch(object);
    __builtin_prefetch(static_cast<u8 const*>(object) + 64);
}

template <class T>
T* MakeInPool(InSerialiserDataPool& pool)
{
    static_assert(alignof(T) <= 8);
    u8* const at = pool.Allocate(sizeof(T));
    return at ? new (at) T() : nullptr;
}

} // namespace

InSerialiserLoader::InSerialiserLoader(InStream& in, FileStore& store, InSerialiser::DelayLoadsBehaviour behaviour,
                                       bool checks, InSerialiserFile::ProgressFunc progress, bool wantsReport)
    : m_source(in), m_store(store), m_behaviour(behaviour), m_checks(checks), m_progress(std::move(progress)),
      m_markers(wantsReport ? new InSerialiserObjectMarkers : nullptr), m_pool(new InSerialiserDataPool),
      m_defaultsPool(new InSerialiserDataPool)
{
}

InSerialiserLoader::~InSerialiserLoader()
{
    while (!m_stack.empty()) {
        m_stack.back().Release();
        m_stack.pop_back();
    }
    // Every object's count lies in memory that has grown cold: the next ones are fetched ahead.
    constexpr size_t c_ahead = 12;
    for (size_t i = 0; i < m_objects.size(); ++i) {
        if (i + c_ahead < m_objects.size()) Prefetch(m_objects[i + c_ahead].object);
        m_objects[i].Release();
    }
    for (auto& [index, record] : m_strayObjects) record.Release();
}

Counted<InSerialiserFile> InSerialiserLoader::ReadHeader()
{
    u8 header[c_serialisedHeaderSizeV1];
    if (!m_source.Read(header, sizeof(header)) || LoadLittleEndian<u32>(header) != c_serialisedMagic) return nullptr;
    u16 const formatVersion = LoadLittleEndian<u16>(header + 4);
    if (formatVersion > c_serialisedFormatVersion) {
        Trace(FormatT<String8>(">>> Future file version: %1 (%2 max)\n", formatVersion, c_serialisedFormatVersion));
        throw FutureVersionException(false);
    }
    if (formatVersion >= 2 && !m_source.ReadNumber(m_buildIndex)) return nullptr;
    Counted<InSerialiserFile> file(
        new InSerialiserFile(IDTag(LoadLittleEndian<u32>(header + 6)), LoadLittleEndian<u16>(header + 10)));
    file->m_buildIndex = m_buildIndex;
    file->m_markers = m_markers;
    return file;
}

bool InSerialiserLoader::ParseFile(InSerialiserFile& file)
{
    if (!ParseList(file) || !m_source.Release()) return false;
    file.OwnObjectsI();
    file.m_pool = std::move(m_pool);
    file.m_defaultsPool = std::move(m_defaultsPool);
    file.m_foundMissingFiles = m_missingFiles;
    return true;
}

void InSerialiserLoader::ReportProblem(String8 const& text)
{
    Trace(text + "\n");
    m_missingFiles = true;
}

// Lists.

// The list then lies on top of the stack and owns what is there.
bool InSerialiserLoader::ParseOnStack(InSerialiser& list)
{
    size_t const base = m_stack.size();
    TagBits tags;
    m_source.OpenList();
    if (!ParseProperties(tags)) return false;
    m_source.CloseList();
    u32 const count = ArrangeProperties(m_stack.data() + base, static_cast<u32>(m_stack.size() - base), tags);
    m_stack.resize(base + count);
    list.m_properties = m_stack.data() + base;
    list.m_count = count;
    list.m_tagBits = tags.bits;
    list.m_holdsSomething = tags.holdsSomething;
    return true;
}

bool InSerialiserLoader::ParseList(InSerialiser& list)
{
    size_t const base = m_stack.size();
    if (!ParseOnStack(list)) return false;
    u64 const size = list.m_count * sizeof(InSerialiserProperty);
    u8* const at = GetPool().Allocate(size);
    if (at && size) std::memcpy(at, list.m_properties, size);
    list.m_properties = reinterpret_cast<InSerialiserProperty*>(at);
    if (!at) {
        // They stay the stack's.
        list.m_count = 0;
        return false;
    }
    m_stack.resize(base);
    return true;
}

bool InSerialiserLoader::ParseProperties(TagBits& tags)
{
    for (;;) {
        u8 typeByte = 0;
        if (!m_source.ReadItemByte(typeByte)) return false;
        if (typeByte == 0) return true;
        // Most properties are numbers, which own nothing.
        if (c_inlineSizes[typeByte] != 0) {
            InSerialiserProperty& number = m_stack.emplace_back();
            if (!ParseNumber(typeByte, number)) return false;
            tags.Add(number.tag);
            continue;
        }
        OwnedProperty owned;
        owned.property.typeByte = typeByte;
        if (!ParseProperty(owned.property)) return false;
        m_stack.push_back(owned.property);
        tags.Add(owned.property.tag);
        tags.holdsSomething |= owned.property.HoldsSomething();
        owned.Disown();
    }
}

bool InSerialiserLoader::ParseNumber(u8 typeByte, InSerialiserProperty& property)
{
    u32 const size = c_inlineSizes[typeByte];
    if (!m_source.Fill(sizeof(u32) + size)) return false;
    u8 const* const at = m_source.GetAt();
    property.typeByte = typeByte;
    property.kind = InSerialiserProperty::Type::Value;
    property.tag = IDTag(LoadLittleEndian<u32>(at));
    // Past the value lie bytes of the buffer mostly, and then one load and a mask do.
    if (m_source.GetBuffered() >= sizeof(u32) + sizeof(u64))
        property.number = LoadLittleEndian<u64>(at + sizeof(u32)) & (~u64(0) >> (64 - 8 * size));
    else
        std::memcpy(&property.number, at + sizeof(u32), size);
    m_source.Take(sizeof(u32) + size);
    return true;
}

bool InSerialiserLoader::ParseProperty(InSerialiserProperty& property)
{
    u8 const typeByte = property.typeByte;
    if (!IsKnownWireType(typeByte)) {
        Trace(FormatT<String8>(">>> Use of unknown prop type: %1\n", GetWireType(typeByte)));
        throw FutureVersionException(false);
    }
    if (c_inlineSizes[typeByte] != 0) return ParseNumber(typeByte, property);
    if (!IsLegalWireType(typeByte) || !m_source.ReadNumber(property.tag.value)) return false;
    switch (c_wireTypes[GetWireType(typeByte)].form) {
    case WireForm::DataStream: return ParseDataStream(property);
    case WireForm::Object: return property.IsArray() ? ParseObjects(property) : ParseObject(property);
    case WireForm::Class: return property.IsArray() ? ParseClasses(property) : ParseClass(property);
    case WireForm::DelayLoad: return ParseDelayLoad(property);
    default: return ParseFlat(property);
    }
}

// Values.

bool InSerialiserLoader::ReadHeader(u8 typeByte, WireHeader& header)
{
    u32 const size = GetWireHeaderSize(typeByte);
    if (!m_source.Fill(size)) return false;
    header = DecodeWireHeader(typeByte, m_source.GetAt());
    m_source.Take(size);
    return m_source.Fits(header.payload);
}

bool InSerialiserLoader::ParseFlat(InSerialiserProperty& property)
{
    u8 const typeByte = property.typeByte;
    if (typeByte == static_cast<u8>(PropType::String)) {
        u32 length = 0;
        if (!m_source.ReadNumber(length)) return false;
        if (length < c_ownTextLength && length <= m_source.GetBuffered() && m_defaultsNesting == 0) {
            u8* const at = m_pool->Allocate(sizeof(StoredValue) + length);
            if (!at) return false;
            property.value = new (at) StoredValue{length, 0};
            std::memcpy(at + sizeof(StoredValue), m_source.GetAt(), length);
            m_source.Take(length);
            property.kind = InSerialiserProperty::Type::Value;
            return true;
        }
        return m_source.Fits(length) && ParseText(property, length);
    }
    WireForm const form = c_wireTypes[GetWireType(typeByte)].form;
    WireHeader header;
    if (!ReadHeader(typeByte, header)) return false;
    switch (form) {
    case WireForm::RawData: return ParseRawData(property, header.count, 0);
    case WireForm::Aligned: return ParseRawData(property, header.count, header.extra);
    case WireForm::Fragmented: return ParseFragments(property, header.count, header.extra);
    default: break;
    }
    if (form == WireForm::String && !property.IsArray()) return ParseText(property, header.count);
    if (form == WireForm::Fixed && !property.IsArray()) {
        property.bytes = GetPool().AllocateRead(m_source, 0, header.payload);
        if (!property.bytes) return false;
    } else {
        u8* const at = GetPool().AllocateRead(m_source, sizeof(StoredValue), header.payload);
        if (!at) return false;
        property.value = new (at) StoredValue{header.count, header.extra};
        if (form == WireForm::String && !AreWireTextsSound(property.value->GetPayload(), header.payload, header.count))
            return false;
    }
    property.kind = InSerialiserProperty::Type::Value;
    return true;
}

bool InSerialiserLoader::ParseText(InSerialiserProperty& property, u32 length)
{
    bool const fitsString = length <= INT_MAX / 2 && (m_source.IsSized() || length <= c_unsizedReadAhead);
    if (!fitsString || (length < c_ownTextLength && m_defaultsNesting == 0)) {
        u8* const at = GetPool().AllocateRead(m_source, sizeof(StoredValue), length);
        if (!at) return false;
        property.value = new (at) StoredValue{length, 0};
        property.kind = InSerialiserProperty::Type::Value;
        return true;
    }
    String8* const text = MakeInPool<String8>(GetPool());
    if (!text) return false;
    property.string = text;
    property.isOwnString = true;
    property.kind = InSerialiserProperty::Type::Value;
    return length == 0 || m_source.Read(text->SetLength(static_cast<int>(length)), length);
}

bool InSerialiserLoader::ParseRawData(InSerialiserProperty& property, u32 size, u32 pad)
{
    if (!m_source.Skip(pad)) return false;
    property.rawData = MakeInPool<RawDataBlock>(GetPool());
    if (!property.rawData) return false;
    property.kind = InSerialiserProperty::Type::RawData;
    if (m_source.IsSized() || size <= c_unsizedReadAhead) {
        RawDataBlock data(size);
        if (size > 0 && (!data.GetData() || !m_source.Read(data.GetData(), size))) return false;
        property.rawData->Swap(data);
        return true;
    }
    InSerialiserDataPool collected;
    InSerialiserDataPool::Tail tail(collected);
    if (!tail.Read(m_source, size)) return false;
    RawDataBlock data(size);
    if (!data.GetData()) return false;
    std::memcpy(data.GetData(), tail.GetData(), size);
    property.rawData->Swap(data);
    return true;
}

bool InSerialiserLoader::ParseFragments(InSerialiserProperty& property, u32 size, u32 blockSize)
{
    property.fragments = MakeInPool<StoredFragments>(GetPool());
    if (!property.fragments) return false;
    property.kind = InSerialiserProperty::Type::FragmentedRawData;
    if (size < blockSize && size <= c_unsizedReadAhead) {
        property.fragments->size = size;
        property.fragments->blockSize = blockSize <= c_unsizedReadAhead ? blockSize : size;
        property.fragments->bytes = GetPool().AllocateRead(m_source, 0, size);
        return property.fragments->bytes != nullptr;
    }
    // One block takes all there is at most, whatever the stream says. Where nobody knows how much is left, a large
    // block is not asked for until its bytes have come.
    u32 const block = std::min(size, blockSize);
    bool const isStaged = !m_source.IsSized() && block > c_unsizedReadAhead;
    Counted<FragmentedRawData> data(new FragmentedRawData(isStaged ? c_unsizedReadAhead : block));
    InSerialiserSourceStream* const rest = new InSerialiserSourceStream(m_source);
    Counted<InStream> const keep(rest);
    for (u64 at = 0; at < size;) {
        u64 const piece = m_source.IsSized() ? size - at : std::min(size - at, c_unsizedReadAhead);
        if (data->SetDataFromStream(at, *rest, piece, false) != piece) return false;
        at += piece;
    }
    if (isStaged) {
        Counted<FragmentedRawData> whole(new FragmentedRawData(block));
        u8 piece[16384];
        for (u64 at = 0; at < size;) {
            u64 const got = data->GetData(at, piece, sizeof(piece));
            if (!whole->SetData(at, piece, got, false)) return false;
            at += got;
        }
        data = std::move(whole);
    }
    property.fragments->data = std::move(data);
    return true;
}

bool InSerialiserLoader::ParseDataStream(InSerialiserProperty& property)
{
    u16 version = 0;
    if (!m_source.ReadNumber(version)) return false;
    InSerialiserDataPool::Tail items(GetPool());
    if (!items.Extend(0)) return false;
    m_source.OpenList();
    for (;;) {
        u8 typeByte = 0;
        if (!m_source.ReadItemByte(typeByte)) return false;
        if (typeByte == 0) break;
        if (!IsLegalInDataStream(typeByte)) return false;
        u32 const headerSize = GetWireHeaderSize(typeByte);
        if (!m_source.Fill(headerSize)) return false;
        u8* const at = items.Extend(1 + headerSize);
        if (!at) return false;
        at[0] = typeByte;
        std::memcpy(at + 1, m_source.GetAt(), headerSize);
        m_source.Take(headerSize);
        WireHeader const header = DecodeWireHeader(typeByte, at + 1);
        u64 const payloadAt = items.GetSize();
        if (!items.Read(m_source, header.payload)) return false;
        if (c_wireTypes[GetWireType(typeByte)].form == WireForm::String && IsWireArray(typeByte) &&
            !AreWireTextsSound(items.GetData() + payloadAt, header.payload, header.count))
            return false;
    }
    m_source.CloseList();
    u8 const* const data = items.GetData();
    u8* const at = GetPool().Allocate(sizeof(StoredDataStream));
    if (!at) return false;
    property.dataStream = new (at) StoredDataStream{data, items.GetSize(), version};
    property.kind = InSerialiserProperty::Type::DataStream;
    return true;
}

// Inline classes.

Counted<InSerialiser> InSerialiserLoader::MakeList() const
{
    Counted<InSerialiser> list(new InSerialiser);
    list->m_buildIndex = m_buildIndex;
    list->m_markers = m_markers;
    return list;
}

bool InSerialiserLoader::ReadClassList(Counted<InSerialiser const>& list)
{
    NestingGuard const level;
    if (!level.IsAllowed()) return false;
    Counted<InSerialiser> const parsed = MakeList();
    if (!ParseList(*parsed)) return false;
    list = parsed;
    return true;
}

bool InSerialiserLoader::ParseClass(InSerialiserProperty& property)
{
    u8 isThere = 0;
    if (!m_source.ReadNumber(isThere) || isThere > 1) return false;
    StoredClass stored;
    if (isThere) {
        if (!m_source.ReadNumber(stored.uid.value) || !m_source.ReadNumber(stored.version)) return false;
        if (!ReadClassList(stored.list)) return false;
    }
    property.inlineClass = MakeInPool<StoredClass>(GetPool());
    if (!property.inlineClass) return false;
    property.kind = InSerialiserProperty::Type::Class;
    *property.inlineClass = std::move(stored);
    return true;
}

bool InSerialiserLoader::ParseClasses(InSerialiserProperty& property)
{
    u32 count = 0;
    property.classes = MakeInPool<StoredClasses>(GetPool());
    if (!property.classes) return false;
    property.kind = InSerialiserProperty::Type::ClassArray;
    StoredClasses& classes = *property.classes;
    if (!m_source.ReadNumber(count) || !m_source.ReadNumber(classes.uid.value) ||
        !m_source.ReadNumber(classes.version) || !m_source.Fits(count))
        return false;
    for (u32 i = 0; i < count; ++i) {
        u8 isThere = 0;
        Counted<InSerialiser const> list;
        if (!m_source.ReadNumber(isThere) || isThere > 1 || (isThere && !ReadClassList(list))) return false;
        classes.lists.push_back(std::move(list));
    }
    return true;
}

// References to items that are loaded on demand.

bool InSerialiserLoader::ParseDelayLoad(InSerialiserProperty& property)
{
    ClassUID uid;
    u32 length = 0;
    if (!m_source.ReadNumber(uid.value) || !m_source.ReadNumber(length)) return false;
    property.holder = nullptr;
    property.kind = InSerialiserProperty::Type::DelayLoad;
    if (length == 0) return true;
    if (uid.value == 0) return m_source.Skip(length);
    if (length > INT_MAX) return false;
    u8 const* const path = GetPool().AllocateRead(m_source, 0, length);
    if (!path) return false;
    FileStoreItemType const* const type = FileStoreItemType::FindFileStoreItemType(uid);
    if (!type) return false;
    Counted<DelayLoadHolder> holder = m_store.CreateDelayLoadHolderDirect(
        String8(reinterpret_cast<char const*>(path), static_cast<int>(length)), type, this);
    if (!holder || !holder->HasLivingOwner()) m_missingFiles = true;
    if (!holder) return true;
    ApplyBehaviour(*holder);
    property.holder = holder.Detach();
    return true;
}

void InSerialiserLoader::ApplyBehaviour(DelayLoadHolder& holder) const
{
    if (m_behaviour == InSerialiser::DelayLoadsBehaviour::Leave) return;
    // An item that was in memory before is somebody's: let go, it would come in a second time beside the one in use.
    bool const wasLoaded = holder.IsLoaded();
    {
        JailCounted<FileStoreItem> item;
        holder.GetItemBase(item);
    }
    if (m_behaviour == InSerialiser::DelayLoadsBehaviour::Prove && !wasLoaded) holder.ReleaseItem();
}

} // namespace Kernel
