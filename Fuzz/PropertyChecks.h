#pragma once

#include "FuzzTarget.h"
#include "libkernel/serialisation/EnumSerialiser.h"
#include "libkernel/serialisation/FlagSerialiser.h"
#include "libkernel/serialisation/FutureVersionException.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/InSerialiserPropertyDataStream.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/serialisation/OutSerialiserPropertyDataStream.h"
#include "libkernel/serialisation/PropertyStreamDump.h"
#include "libkernel/streams/MemoryStreams.h"
#include "serialisation/ReaderClasses.h"
#include "support/LoadEverything.h"

#include <map>
#include <string>
#include <vector>

namespace Kernel::Fuzz {

using Bytes = std::vector<u8>;
using PropertyKind = InSerialiser::PropertyType;

/// Objects of damaged streams make circles, which have to be broken before the next input.
class CircleBreaker
{
public:
    ~CircleBreaker() { Test::ReaderNode::DropAll(); }
};

/// Knows one set with every code, each standing for itself.
inline EnumSerialiser const& GetPlainEnums()
{
    static EnumSerialiser const s_enums = [] {
        std::vector<EnumSerialiser::EnumEntry> entries;
        for (int i = 0; i < 65535; ++i) entries.push_back({i});
        EnumSerialiser enums;
        enums.RegisterEnumSet(entries.data(), entries.size());
        return enums;
    }();
    return s_enums;
}

inline FlagSerialiser const& GetPlainFlags()
{
    static FlagSerialiser const s_flags = [] {
        std::vector<FlagSerialiser::FlagIndex> indices;
        for (int i = 0; i < 64; ++i) indices.push_back({i});
        FlagSerialiser flags;
        flags.RegisterFlagIndices(indices.data(), indices.size());
        return flags;
    }();
    return s_flags;
}

constexpr u32 c_largestCustom = 80; ///< Nothing tells the size of a custom block, so the sizes up to this are tried.

/// The values of one list as text, and the same values saved again. What does not load is in neither: enums of other
/// versions, larger custom blocks, string-shaped values; nor are items that load on demand, which take a store.
class PropertyCopier
{
public:
    /// @p out may be null: then nothing is saved.
    explicit PropertyCopier(OutSerialiser* out) : m_out(out) {}

    void CopyList(InSerialiser const& in)
    {
        for (IDTag tag : in.GetTags()) CopyItem(in, tag);
        Put("end", nullptr, 0);
    }

    /// The text, with what the objects met on the way hold.
    std::string TakeText()
    {
        for (size_t i = 0; i < m_queue.size(); ++i) DescribeObject(m_queue[i]);
        return std::move(m_text);
    }

private:
    using Value = InSerialiser::PropertyTypeParams;

    void Put(char const* what, void const* data, u64 size)
    {
        m_text += what;
        m_text += ' ' + std::to_string(size) + ' ';
        if (size) m_text.append(static_cast<char const*>(data), size);
        m_text += '\n';
    }
    void PutNumber(char const* what, u64 number) { Put(what, &number, sizeof(number)); }
    void PutFlags(std::vector<bool> const& flags)
    {
        std::string text;
        for (bool flag : flags) text += flag ? '1' : '0';
        Put("bools", text.data(), text.size());
    }
    void PutTexts(std::vector<String8> const& texts)
    {
        PutNumber("texts", texts.size());
        for (String8 const& text : texts) Put("text", text.GetData(), static_cast<u64>(text.GetLength()));
    }

    void CopyItem(InSerialiser const& in, IDTag tag)
    {
        PropertyKind const kind = in.GetPropertyType(tag);
        if (kind == PropertyKind::DelayLoad) return;
        u64 const start = m_text.size();
        PutNumber("tag", tag.value);
        u64 const front = m_text.size();
        CopyKind(in, tag, kind);
        if (m_text.size() == front) m_text.resize(start);
    }
    void CopyKind(InSerialiser const& in, IDTag tag, PropertyKind kind)
    {
        switch (kind) {
        case PropertyKind::Value: return CopyValue(in, tag);
        case PropertyKind::RawData:
        case PropertyKind::FragmentedRawData: return CopyData(in, tag, kind);
        case PropertyKind::DataStream: return CopyStream(in, tag);
        case PropertyKind::Class:
        case PropertyKind::ClassArray: return CopyClasses(in, tag, kind);
        default: return CopyObjects(in, tag, kind);
        }
    }

    void CopyValue(InSerialiser const& in, IDTag tag)
    {
        Value params;
        Require(in.GetPropertyParams(tag, params), "a value can be described");
        u32 const size = c_propSizes[static_cast<u8>(params.type)];
        if (params.type == PropType::Enum) return CopyEnum(in, tag, params);
        if (params.type == PropType::FlagSet) return CopyFlags(in, tag);
        if (params.type == PropType::Custom) return CopyCustom(in, tag, params);
        if (params.type == PropType::StringShaped) return; // Passed over, and never written.
        if (params.isArray && params.type == PropType::Bool) {
            std::vector<bool> flags;
            Require(in.LoadTypes(tag, flags) && flags.size() == params.arrayCount, "bools load");
            PutFlags(flags);
            if (m_out) m_out->SaveTypes(tag, flags);
        } else if (params.isArray && size == 0) {
            std::vector<String8> texts;
            Require(in.LoadTypes(tag, texts) && texts.size() == params.arrayCount, "texts load");
            PutTexts(texts);
            if (m_out) m_out->SaveTypes(tag, texts.data(), texts.size());
        } else if (params.isArray) {
            u64 count = 0;
            void const* const values = in.LoadTypeArrayI(tag, params.type, size, count);
            Require(values && count == params.arrayCount, "an array of values of fixed size loads");
            Put("values", values, count * size);
            if (m_out) m_out->SaveTypeArrayI(tag, params.type, values, size, count);
        } else if (params.type == PropType::Bool) {
            bool flag = false;
            Require(in.LoadType(tag, flag), "a bool loads");
            PutNumber("bool", flag);
            if (m_out) m_out->SaveType(tag, flag);
        } else if (size == 0) {
            std::string_view text;
            Require(in.LoadTextView(tag, text), "a text loads");
            Put("text", text.data(), text.size());
            if (m_out) m_out->SaveStringI(tag, text.data(), text.size());
        } else {
            u8 value[c_maxRawStructSize];
            bool const isStruct = params.type > PropType::RawStruct;
            Require(isStruct ? in.LoadRawStructI(tag, value, size) : in.LoadTypeI(tag, params.type, value, size),
                    "a value of fixed size loads");
            Put("value", value, size);
            if (m_out && isStruct) m_out->SaveRawStructI(tag, value, size);
            if (m_out && !isStruct) m_out->SaveTypeI(tag, params.type, value, size);
        }
    }

    void CopyEnum(InSerialiser const& in, IDTag tag, Value const& params)
    {
        int value = 0;
        std::vector<int> values;
        try {
            if (params.isArray ? !in.LoadEnumI(tag, GetPlainEnums(), values)
                               : !in.LoadEnumI(tag, GetPlainEnums(), value))
                Require(false, "an enum loads or is unknown");
        } catch (UnknownEnumVersionException const&) {
            return;
        }
        if (params.isArray) {
            Put("enums", values.data(), values.size() * sizeof(int));
            if (m_out) m_out->SaveEnumsI(tag, GetPlainEnums(), values.data(), values.size());
        } else {
            PutNumber("enum", static_cast<u64>(value));
            if (m_out) m_out->SaveEnumI(tag, GetPlainEnums(), value);
        }
    }

    void CopyFlags(InSerialiser const& in, IDTag tag)
    {
        u64 flags = 0;
        try {
            if (!in.LoadFlagSetI(tag, GetPlainFlags(), flags, 8)) return;
        } catch (UnknownFlagVersionException const&) {
            return;
        }
        PutNumber("flags", flags);
        if (m_out) m_out->SaveFlagSetI(tag, GetPlainFlags(), flags, 8);
    }

    void CopyCustom(InSerialiser const& in, IDTag tag, Value const& params)
    {
        u8 block[c_largestCustom];
        u64 count = 0;
        for (u64 size = 0; size <= c_largestCustom; ++size) {
            if (!params.isArray && in.LoadTypeCustomI(tag, block, size)) {
                Put("custom", block, size);
                if (m_out) m_out->SavePropertyStructI(tag, block, size);
                return;
            }
            void const* const blocks = params.isArray ? in.LoadTypeCustomArrayI(tag, size, count) : nullptr;
            if (!blocks) continue;
            PutNumber("count", count);
            Put("customs", blocks, count * size);
            if (m_out) m_out->SavePropertyStructArrayI(tag, blocks, size, count);
            return;
        }
    }

    void CopyData(InSerialiser const& in, IDTag tag, PropertyKind kind)
    {
        if (kind == PropertyKind::RawData) {
            RawDataBlock data;
            Require(in.LoadRawData(tag, data), "raw data loads");
            Put("data", data.GetData(), data.GetSize());
            if (m_out) m_out->SaveRawData(tag, data.GetData(), data.GetSize());
            return;
        }
        Counted<FragmentedRawData> data;
        Require(in.LoadFragmentedRawData(tag, data) && data, "fragmented data loads");
        Bytes bytes(data->GetSize());
        Require(data->GetData(0, bytes.data(), bytes.size()) == bytes.size(), "fragmented data can be read");
        Put("fragments", bytes.data(), bytes.size());
        if (m_out) m_out->SaveFragmentedRawData(tag, *data);
    }

    void CopyStream(InSerialiser const& in, IDTag tag)
    {
        InSerialiserPropertyDataStream stream;
        Require(in.LoadDataStream(tag, stream), "a data stream loads");
        PutNumber("stream", stream.GetVersion());
        std::unique_ptr<OutSerialiserPropertyDataStream> out;
        if (m_out) out = std::make_unique<OutSerialiserPropertyDataStream>(*m_out, tag, stream.GetVersion());
        while (stream.GetCurrentPropType() != PropType::EndOfList && CopyStreamItem(stream, out.get())) {
        }
        Put("end of stream", nullptr, 0);
        if (out) out->Close();
    }

    // False where an item does not load: nothing behind it can be reached.
    bool CopyStreamItem(InSerialiserPropertyDataStream& in, OutSerialiserPropertyDataStream* out)
    {
        PropType const type = in.GetCurrentPropType();
        u64 const size = c_propSizes[static_cast<u8>(type)];
        u64 const unit = in.GetStructByteSize();
        u64 count = in.GetArrayCount();
        bool const isArray = in.IsArray();
        if (type == PropType::Enum) return CopyStreamEnum(in, out);
        if (type == PropType::StringShaped) return false;
        if (type == PropType::Bool && isArray) {
            std::vector<bool> flags;
            Require(in.LoadValues(flags) && flags.size() == count, "bools load from a data stream");
            PutFlags(flags);
            if (out) out->SaveValues(flags);
        } else if (type == PropType::Bool) {
            bool flag = false;
            Require(in.LoadValue(flag), "a bool loads from a data stream");
            PutNumber("bool", flag);
            if (out) out->SaveValue(flag);
        } else if (type == PropType::Custom && isArray) {
            void const* const blocks = in.LoadValueCustomArrayI(unit, count);
            Require(blocks, "custom blocks load from a data stream");
            PutNumber("count", count);
            Put("customs", blocks, count * unit);
            if (out) out->SaveValueStructArrayI(blocks, unit, count);
        } else if (type == PropType::Custom) {
            Bytes block(unit);
            Require(in.LoadValueCustomI(block.data(), unit), "a custom block loads from a data stream");
            Put("custom", block.data(), unit);
            if (out) out->SaveValueStructI(block.data(), unit);
        } else if (type == PropType::RawData) {
            RawDataBlock data;
            Require(in.LoadValueRaw(data) && data.GetSize() == unit, "raw data loads from a data stream");
            Put("data", data.GetData(), data.GetSize());
            if (out) out->SaveValueRaw(data.GetData(), data.GetSize());
        } else if (size == 0 && isArray) {
            std::vector<String8> texts;
            Require(in.LoadValues(texts) && texts.size() == count, "texts load from a data stream");
            PutTexts(texts);
            if (out) out->SaveValues(texts.data(), texts.size());
        } else if (size == 0) {
            String8 text;
            Require(in.LoadValue(text), "a text loads from a data stream");
            Put("text", text.GetData(), static_cast<u64>(text.GetLength()));
            if (out) out->SaveValue(text);
        } else if (isArray) {
            void const* const values = in.LoadValueArrayI(type, size, count);
            Require(values, "an array of values loads from a data stream");
            Put("values", values, count * size);
            if (out) out->SaveValueArrayI(type, values, size, count);
        } else {
            u8 value[c_maxRawStructSize];
            Require(in.LoadValueI(type, value, size), "a value loads from a data stream");
            Put("value", value, size);
            if (out) out->SaveValueI(type, value, size);
        }
        return true;
    }

    bool CopyStreamEnum(InSerialiserPropertyDataStream& in, OutSerialiserPropertyDataStream* out)
    {
        int value = 0;
        std::vector<int> values;
        bool const isArray = in.IsArray();
        try {
            Require(isArray ? in.LoadEnumI(GetPlainEnums(), values) : in.LoadEnumI(GetPlainEnums(), value),
                    "an enum loads from a data stream or is unknown");
        } catch (UnknownEnumVersionException const&) {
            return false;
        }
        if (isArray) {
            Put("enums", values.data(), values.size() * sizeof(int));
            if (out) out->SaveEnumsI(GetPlainEnums(), values.data(), values.size());
        } else {
            PutNumber("enum", static_cast<u64>(value));
            if (out) out->SaveEnumI(GetPlainEnums(), value);
        }
        return true;
    }

    void CopyChild(InSerialiser const& in)
    {
        OutSerialiser* const parent = m_out;
        if (!parent) return CopyList(in);
        OutSerialiser child(*parent, nullptr);
        m_out = &child;
        CopyList(in);
        child.Close();
        m_out = parent;
    }

    void CopyClasses(InSerialiser const& in, IDTag tag, PropertyKind kind)
    {
        ClassUID uid;
        unsigned short version = 0;
        if (kind == PropertyKind::Class) {
            Counted<InSerialiser const> const list = in.LoadClassI(tag, uid, version);
            PutNumber("class", list ? uid.value : 0);
            PutNumber("version", version);
            if (!list) {
                if (m_out) m_out->SaveNullPropClassI(tag);
                return;
            }
            if (m_out) {
                m_out->StartClassTestI(tag);
                m_out->StartClassBeginI(tag, uid, version);
            }
            CopyChild(*list);
            if (m_out) m_out->EndPropClassI();
            return;
        }
        auto const* const lists = in.LoadClassesI(tag, uid, version);
        Require(lists, "an array of inline classes loads");
        PutNumber("classes", uid.value);
        PutNumber("version", version);
        if (m_out) {
            m_out->StartClassArrayTestI(tag);
            m_out->StartClassArrayBeginI(tag, uid, version, lists->size());
        }
        for (auto const& list : *lists) {
            PutNumber("element", list ? 1 : 0);
            if (m_out && list) m_out->StartClassArrayClassI();
            if (m_out && !list) m_out->StartClassArrayClassNullI();
            if (list) CopyChild(*list);
        }
        if (m_out) m_out->EndPropClassArrayI();
    }

    void CopyObjects(InSerialiser const& in, IDTag tag, PropertyKind kind)
    {
        bool const isShared = kind == PropertyKind::SharedObject || kind == PropertyKind::SharedObjectArray;
        bool const isArray =
            kind != PropertyKind::Object && kind != PropertyKind::SharedObject && kind != PropertyKind::NullObject;
        if (isShared && isArray) {
            std::vector<Consolidated<SharedSerialisable>> objects;
            Require(in.LoadSharedObjectsBase(tag, objects), "shared objects load");
            PutNumber("objects", objects.size());
            for (auto const& object : objects) PutObject(object.Get());
            if (m_out) m_out->SaveSharedObjects(tag, objects);
        } else if (isShared) {
            Consolidated<SharedSerialisable> object;
            Require(in.LoadSharedObjectI(tag, object), "a shared object loads");
            PutObject(object.Get());
            if (m_out) m_out->SaveSharedObject(tag, object);
        } else if (isArray) {
            std::vector<Counted<Serialisable>> objects;
            Require(in.LoadObjectsBase(tag, objects, true), "objects load");
            PutNumber("objects", objects.size());
            for (auto const& object : objects) PutObject(object.Get());
            if (m_out) m_out->SaveObjects(tag, objects);
        } else {
            Counted<Serialisable> object;
            Require(in.LoadObjectI(tag, object, true), "an object loads");
            PutObject(object.Get());
            if (m_out) m_out->SaveObject(tag, object);
        }
    }

    // Objects stand for themselves by the order in which they are met, so that circles end and sharing shows.
    struct Seen
    {
        Test::ReaderNode const* node = nullptr;
        Test::ReaderShared const* shared = nullptr;
        Serialisable const* other = nullptr;
    };
    void PutObject(Serialisable const* object)
    {
        PutSeen(object, {dynamic_cast<Test::ReaderNode const*>(object), nullptr, object});
    }
    void PutObject(SharedSerialisable const* object)
    {
        PutSeen(object, {nullptr, dynamic_cast<Test::ReaderShared const*>(object)});
    }
    void PutSeen(void const* object, Seen seen)
    {
        if (!object) return PutNumber("object", 0);
        auto const [at, isNew] = m_numbers.emplace(object, m_numbers.size() + 1);
        PutNumber("object", at->second);
        if (isNew) m_queue.push_back(seen);
    }
    void DescribeObject(Seen const seen)
    {
        if (seen.shared) {
            PutNumber("shared", seen.shared->number);
            return PutObject(seen.shared->next.Get());
        }
        if (!seen.node) return DescribeOther(seen.other);
        PutNumber("node", seen.node->number);
        Put("name", seen.node->name.GetData(), static_cast<u64>(seen.node->name.GetLength()));
        PutObject(seen.node->child.Get());
        PutObject(seen.node->reference.Get());
        PutNumber("kids", seen.node->kids.size());
        for (auto const& kid : seen.node->kids) PutObject(kid.Get());
        PutObject(seen.node->shared.Get());
    }

    // Of the library's own classes, which hold no other objects.
    void DescribeOther(Serialisable const* object)
    {
        Require(object, "only the shared class that is registered is made");
        Counted<MemoryInOutStream> const stream(new MemoryInOutStream);
        OutSerialiserFile out(*stream, "Othr", 0);
        out.SaveObject("Othr", object);
        out.Close();
        Put("other", stream->GetBuffer(), stream->GetSize());
    }

    OutSerialiser* m_out;
    std::string m_text;
    std::map<void const*, u64> m_numbers;
    std::vector<Seen> m_queue;
};

inline std::string Describe(InSerialiser const& in)
{
    PropertyCopier copier(nullptr);
    copier.CopyList(in);
    return copier.TakeText();
}

enum class ParseOutcome
{
    Parsed,
    Refused,
    TooNew,
    UnknownClass
};

struct ParseResult
{
    Counted<InSerialiserFile> file;
    ParseOutcome outcome = ParseOutcome::Refused;
    u64 end = 0;
};

inline ParseResult ParseProperties(Bytes const& bytes, bool checks, Test::Delivery delivery)
{
    ParseResult result;
    Counted<InStream> const in = Test::Deliver(bytes, delivery);
    try {
        result.file = checks ? InSerialiserFile::ParseWithChecks(*in) : InSerialiserFile::ParseSkipUnknownClasses(*in);
        if (result.file) result.outcome = ParseOutcome::Parsed;
    } catch (UnknownClassUIDException const&) {
        result.outcome = ParseOutcome::UnknownClass;
    } catch (FutureVersionException const&) {
        result.outcome = ParseOutcome::TooNew;
    } catch (UnknownEnumVersionException const&) {
        result.outcome = ParseOutcome::TooNew; // Out of the Load of one of the library's own classes.
    }
    result.end = in->Tell();
    return result;
}

/// Saves what a parse gave, reads that and compares. False where the limits of a save are in the way: what is reached
/// through back references may nest deeper than the file that it came from.
inline bool CheckSavedAgain(InSerialiserFile const& file)
{
    Counted<MemoryInOutStream> const stream(new MemoryInOutStream);
    std::string text;
    try {
        OutSerialiserFile out(*stream, file.GetFileIDTag(), file.GetFileVersion());
        PropertyCopier copier(&out);
        copier.CopyList(file);
        out.Close();
        text = copier.TakeText();
    } catch (OutSerialiser::SaveException const& exception) {
        Require(exception.GetCode() == OutSerialiser::SaveException::Misuse, "what was read can be saved");
        return false;
    }
    u8 const* const begin = static_cast<u8 const*>(stream->GetBuffer());
    ParseResult const again = ParseProperties(Bytes(begin, begin + stream->GetSize()), true, Test::Delivery::Memory);
    Require(again.outcome == ParseOutcome::Parsed, "what was saved can be read");
    Require(again.end == stream->GetSize(), "what was saved is read to its end");
    Require(again.file->GetFileIDTag() == file.GetFileIDTag() && again.file->GetFileVersion() == file.GetFileVersion(),
            "the header comes back");
    Require(Describe(*again.file) == text, "what was saved reads back equal");
    return true;
}

/// Everything that must hold for the bytes of any property stream, read by @p checks or by the form that skips unknown
/// classes.
inline void CheckProperties(Bytes const& bytes, bool checks, Test::Delivery delivery)
{
    CircleBreaker const breaker;
    ParseResult const mine = ParseProperties(bytes, checks, delivery);
    ParseResult const other = ParseProperties(bytes, !checks, delivery);
    ParseResult const& checked = checks ? mine : other;
    ParseResult const& tolerant = checks ? other : mine;
    if (checked.outcome != ParseOutcome::UnknownClass) {
        Require(checked.outcome == tolerant.outcome, "both forms agree when no class is unknown");
        Require(!checked.file || Describe(*checked.file) == Describe(*tolerant.file), "both forms read the same");
    }
    // Of several faults, which one is met first may depend on the delivery: a count that goes beyond the end is refused
    // at once where the size is known, and elsewhere an unknown type may come before the end.
    if (delivery != Test::Delivery::Memory) {
        ParseResult const plain = ParseProperties(bytes, checks, Test::Delivery::Memory);
        Require(!plain.file == !mine.file, "what can be read does not depend on the delivery");
        Require(!mine.file || Describe(*mine.file) == Describe(*plain.file), "every delivery reads the same");
    }
    Counted<InStream> const in = Test::Deliver(bytes, Test::Delivery::Memory);
    PropertyStreamReport const report = CheckPropertyStream(*in);
    Require(report.offset <= bytes.size(), "damage lies in the stream");
    if (!mine.file) return;
    // What stands in an object that is skipped need not be sound.
    if (checked.file)
        Require(report.IsGood() && report.offset == mine.end, "what can be read is sound, up to the same end");
    CheckSavedAgain(*mine.file);
    Test::LoadEverything(*mine.file);
}

/// The same for an input of which the first byte chooses how the stream delivers.
inline void CheckDelivered(uint8_t const* data, size_t size, bool checks)
{
    Input input(data, size);
    Test::Delivery const delivery = Test::c_deliveries[input.TakeBelow(4)];
    CheckProperties(Bytes(input.GetRest(), input.GetRest() + input.GetLeft()), checks, delivery);
}

} // namespace Kernel::Fuzz
