#include "libkernel/serialisation/PropertyStreamDump.h"

#include "libkernel/core/Format.h"
#include "libkernel/core/Limits.h"
#include "libkernel/core/NestingGuard.h"
#include "libkernel/serialisation/internal/InSerialiserDataPool.h"
#include "libkernel/serialisation/internal/InSerialiserSource.h"
#include "libkernel/serialisation/internal/PropertyWire.h"

#include <algorithm>
#include <iterator>
#include <nlohmann/json.hpp>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace Kernel {

namespace {

// One walk serves both operations: where it is given a value to fill it builds what it passes, and without one it only
// looks. The order of the steps is that of the format table in PropType.h.

using Json = nlohmann::ordered_json;
using Result = PropertyStreamReport::Result;

std::string HexText(u8 const* bytes, u64 size)
{
    constexpr char c_digits[] = "0123456789abcdef";
    std::string text;
    text.reserve(2 * size);
    for (u64 i = 0; i < size; ++i) {
        text += c_digits[bytes[i] >> 4];
        text += c_digits[bytes[i] & 15];
    }
    return text;
}

std::string CodeText(u32 code)
{
    std::string text;
    for (int shift = 24; shift >= 0; shift -= 8) {
        u8 const c = static_cast<u8>(code >> shift);
        if (c < 0x80)
            text += static_cast<char>(c);
        else {
            text += static_cast<char>(0xC0 | c >> 6);
            text += static_cast<char>(0x80 | (c & 0x3F));
        }
    }
    return text;
}

std::string ClassText(u32 code)
{
    return code == 0 ? std::string("<>") : CodeText(code);
}

Json TextValue(u8 const* bytes, u64 size)
{
    Json value = std::string_view(reinterpret_cast<char const*>(bytes), size);
    if (std::all_of(bytes, bytes + size, [](u8 c) { return c < 0x80; })) return value;
    // Written and read back, since the JSON library only mends ill-formed text on its way out.
    return Json::parse(value.dump(-1, ' ', false, Json::error_handler_t::replace));
}

template <class T>
Json NumberValue(u8 const* at)
{
    T value;
    std::memcpy(&value, at, sizeof(T));
    return value;
}
using ElementFunc = Json (*)(u8 const*);
constexpr ElementFunc c_numbers[] = {nullptr,           &NumberValue<u8>,    &NumberValue<u16>,   &NumberValue<u32>,
                                     &NumberValue<u64>, &NumberValue<i8>,    &NumberValue<i16>,   &NumberValue<i32>,
                                     &NumberValue<i64>, &NumberValue<float>, &NumberValue<double>};

Json FixedValue(u8 type, u8 const* at)
{
    if (type < std::size(c_numbers)) return c_numbers[type](at);
    if (type == static_cast<u8>(PropType::Tag)) return CodeText(LoadLittleEndian<u32>(at));
    if (type == static_cast<u8>(PropType::UID)) return ClassText(LoadLittleEndian<u32>(at));
    return HexText(at, c_propSizes[type]);
}

std::string FlagBits(u8 const* bytes, u64 size)
{
    std::vector<u8> const reversed(std::reverse_iterator(bytes + size), std::reverse_iterator(bytes));
    std::string const digits = HexText(reversed.data(), size);
    size_t const first = digits.find_first_not_of('0');
    return first == digits.npos ? "0" : digits.substr(first);
}

Json ArrayValue(u8 type, WireHeader const& header, u8 const* at)
{
    WireForm const form = c_wireTypes[type].form;
    Json list = Json::array();
    u64 const step = form == WireForm::Fixed ? c_propSizes[type] : form == WireForm::Enum ? 2 : header.extra;
    for (u64 i = 0; i < header.count; ++i) {
        switch (form) {
        case WireForm::Fixed: list.push_back(FixedValue(type, at + i * step)); break;
        case WireForm::Bool: list.push_back((at[i / 8] >> (i % 8) & 1) != 0); break;
        case WireForm::Enum: list.push_back(LoadLittleEndian<u16>(at + i * step)); break;
        case WireForm::Custom: list.push_back(HexText(at + i * step, step)); break;
        default: {
            u32 const length = LoadLittleEndian<u32>(at);
            list.push_back(TextValue(at + 4, length));
            at += 4 + u64(length);
        }
        }
    }
    if (form != WireForm::Enum) return list;
    return {{"codes", std::move(list)}, {"version", header.extra}};
}

Json ScalarValue(u8 type, WireHeader const& header, u8 const* at)
{
    switch (c_wireTypes[type].form) {
    case WireForm::Fixed: return FixedValue(type, at);
    case WireForm::Bool: return *at != 0;
    case WireForm::Enum: return {{"code", LoadLittleEndian<u16>(at)}, {"version", LoadLittleEndian<u16>(at + 2)}};
    case WireForm::String: return TextValue(at, header.payload);
    case WireForm::FlagSet: return {{"version", header.extra}, {"bits", FlagBits(at, header.payload)}};
    case WireForm::Aligned: return HexText(at + header.extra, header.count);
    default: return HexText(at, header.payload);
    }
}

class Walker
{
public:
    Walker(InStream& in, PropertyStreamReport& report) : m_source(in), m_report(report) {}

    bool WalkFile(Json* json)
    {
        Json properties = Json::array();
        if (!WalkHeader(json) || !WalkList(json ? &properties : nullptr)) return false;
        if (json) (*json)["properties"] = std::move(properties);
        m_report.offset = m_source.GetTaken();
        if (m_source.Release()) return true;
        return Fail(Result::Damaged, m_report.offset, "the stream can't be set back to behind the list");
    }

private:
    bool Fail(Result result, u64 offset, String8 const& reason)
    {
        m_report.result = result;
        m_report.offset = offset;
        m_report.reason = reason;
        std::string path;
        for (IDTag tag : m_path) path += (path.empty() ? "" : "/") + CodeText(tag.value);
        m_report.path = String8(path.c_str());
        return false;
    }
    bool Damage(u64 offset, String8 const& reason) { return Fail(Result::Damaged, offset, reason); }
    bool Damage(u64 offset, char const* reason) { return Fail(Result::Damaged, offset, String8(reason)); }
    bool EndsIn(char const* what)
    {
        return Damage(m_source.GetFetched(), FormatT<String8>("the stream ends inside %1", what));
    }

    template <class T>
    bool Number(T& value, char const* what)
    {
        return m_source.ReadNumber(value) || EndsIn(what);
    }
    // A length or count that says more than there is.
    bool Fits(u64 size, u64 offset, char const* what)
    {
        if (m_source.Fits(size)) return true;
        return Damage(offset, FormatT<String8>("%1 of %2 bytes passes the end of the stream", what, size));
    }
    bool IsDeepEnough(NestingGuard const& level)
    {
        if (level.IsAllowed()) return true;
        return Damage(m_source.GetTaken(), FormatT<String8>("nested deeper than %1 levels", c_maxNesting));
    }

    bool WalkHeader(Json* json)
    {
        u8 header[c_serialisedHeaderSizeV1];
        if (!m_source.Read(header, sizeof(header)))
            return Fail(Result::NotAStream, m_source.GetFetched(), "shorter than a header");
        if (LoadLittleEndian<u32>(header) != c_serialisedMagic)
            return Fail(Result::NotAStream, 0, "the first four bytes are not those of a property stream");
        u16 const formatVersion = LoadLittleEndian<u16>(header + 4);
        if (formatVersion > c_serialisedFormatVersion)
            return Fail(Result::Newer, 4,
                        FormatT<String8>("format version %1, later than %2", formatVersion, c_serialisedFormatVersion));
        u32 buildIndex = 0;
        if (formatVersion >= 2 && !Number(buildIndex, "the header")) return false;
        if (!json) return true;
        (*json)["fileTag"] = CodeText(LoadLittleEndian<u32>(header + 6));
        (*json)["formatVersion"] = formatVersion;
        (*json)["fileVersion"] = LoadLittleEndian<u16>(header + 10);
        (*json)["buildIndex"] = buildIndex;
        return true;
    }

    bool WalkList(Json* items)
    {
        m_source.OpenList();
        for (;;) {
            u64 const at = m_source.GetTaken();
            u8 typeByte = 0;
            IDTag tag;
            if (!m_source.ReadItemByte(typeByte)) return EndsIn("a property list");
            if (typeByte == 0) break;
            if (!IsKnownWireType(typeByte))
                return Fail(Result::Newer, at, FormatT<String8>("unknown property type %1", GetWireType(typeByte)));
            if (!IsLegalWireType(typeByte))
                return Damage(at, FormatT<String8>("property type %1 has no array form", GetWireType(typeByte)));
            if (!Number(tag.value, "a tag")) return false;
            m_path.push_back(tag);
            Json item;
            if (items) item = {{"tag", CodeText(tag.value)}, {"type", GetWireType(typeByte)}};
            if (!WalkItem(typeByte, items ? &item : nullptr)) return false;
            if (items) items->push_back(std::move(item));
            m_path.pop_back();
        }
        m_source.CloseList();
        return true;
    }

    bool WalkItem(u8 typeByte, Json* item)
    {
        bool const isArray = IsWireArray(typeByte);
        if (item && isArray) (*item)["array"] = true;
        switch (c_wireTypes[GetWireType(typeByte)].form) {
        case WireForm::DataStream: return WalkDataStream(item);
        case WireForm::Object: return isArray ? WalkObjects(item) : WalkObject(item);
        case WireForm::Class: return isArray ? WalkClasses(item) : WalkClass(item);
        case WireForm::DelayLoad: return WalkDelayLoad(item);
        default: return WalkFlat(typeByte, item);
        }
    }

    bool WalkFlat(u8 typeByte, Json* item)
    {
        u64 const at = m_source.GetTaken();
        u32 const headerSize = GetWireHeaderSize(typeByte);
        if (!m_source.Fill(headerSize)) return EndsIn("the header of a value");
        WireHeader const header = DecodeWireHeader(typeByte, m_source.GetAt());
        m_source.Take(headerSize);
        if (headerSize > 0 && !Fits(header.payload, at, "a value")) return false;
        bool const isTexts = c_wireTypes[GetWireType(typeByte)].form == WireForm::String && IsWireArray(typeByte);
        if (!item) return isTexts ? SkipTexts(at, header) : m_source.Skip(header.payload) || EndsIn("a value");
        m_pool.GiveBack({});
        u8 const* const bytes = m_pool.AllocateRead(m_source, 0, header.payload);
        if (!bytes) return EndsIn("a value");
        if (isTexts && !AreWireTextsSound(bytes, header.payload, header.count)) return BadTexts(at);
        (*item)["value"] = IsWireArray(typeByte) ? ArrayValue(GetWireType(typeByte), header, bytes)
                                                 : ScalarValue(GetWireType(typeByte), header, bytes);
        return true;
    }

    bool BadTexts(u64 at) { return Damage(at, "the lengths of an array of strings disagree with its total"); }

    bool SkipTexts(u64 at, WireHeader const& header)
    {
        u64 left = header.payload;
        for (u64 count = header.count; count > 0; --count) {
            u32 length = 0;
            if (left < sizeof(length)) return BadTexts(at);
            if (!Number(length, "an array of strings")) return false;
            left -= sizeof(length);
            if (length > left) return BadTexts(at);
            if (!m_source.Skip(length)) return EndsIn("an array of strings");
            left -= length;
        }
        return left == 0 || BadTexts(at);
    }

    bool WalkDataStream(Json* item)
    {
        u16 version = 0;
        Json items = Json::array();
        if (!Number(version, "a data stream")) return false;
        m_source.OpenList();
        for (;;) {
            u64 const at = m_source.GetTaken();
            u8 typeByte = 0;
            if (!m_source.ReadItemByte(typeByte)) return EndsIn("a data stream");
            if (typeByte == 0) break;
            if (!IsLegalInDataStream(typeByte))
                return Damage(at, FormatT<String8>("type byte %1 can't stand in a data stream", typeByte));
            Json value;
            if (item) value["type"] = GetWireType(typeByte);
            if (!WalkItem(typeByte, item ? &value : nullptr)) return false;
            if (item) items.push_back(std::move(value));
        }
        m_source.CloseList();
        if (item) (*item)["value"] = {{"version", version}, {"items", std::move(items)}};
        return true;
    }

    // The keys of an object go into @p item; a null only sets its value.
    bool WalkObject(Json* item)
    {
        u64 const at = m_source.GetTaken();
        u8 first = 0;
        u32 index = 0;
        if (!Number(first, "an object")) return false;
        if (first > static_cast<u8>(ObjectRecord::Back))
            return Damage(at, FormatT<String8>("byte %1 begins no object", first));
        if (first == static_cast<u8>(ObjectRecord::Null)) return SetNull(item);
        if (!Number(index, "an object")) return false;
        if (first == static_cast<u8>(ObjectRecord::Back)) {
            if (!m_objects.contains(index))
                return Damage(at, FormatT<String8>("reference to object %1, which has not been seen", index));
            if (item) (*item)["ref"] = index;
            return true;
        }
        if (!m_objects.insert(index).second)
            return Damage(at, FormatT<String8>("object %1 appears a second time", index));
        NestingGuard const level;
        if (!IsDeepEnough(level)) return false;
        Json classes = Json::array();
        Json properties = Json::array();
        if (!WalkClassChain(item ? &classes : nullptr) || !WalkList(item ? &properties : nullptr)) return false;
        if (!item) return true;
        (*item)["object"] = index;
        (*item)["classes"] = std::move(classes);
        (*item)["properties"] = std::move(properties);
        return true;
    }

    // A loop over the parents: their number is the stream's.
    bool WalkClassChain(Json* classes)
    {
        std::vector<u32> open;
        for (;;) {
            u64 const at = m_source.GetTaken();
            u8 first = 0;
            u32 uid = 0;
            u16 version = 0;
            if (!Number(first, "a class record")) return false;
            if (first == static_cast<u8>(ClassRecord::None)) {
                if (open.empty()) return Damage(at, "an object without a class");
                break;
            }
            if (first > static_cast<u8>(ClassRecord::None))
                return Damage(at, FormatT<String8>("byte %1 begins no class record", first));
            if (!Number(uid, "a class record")) return false;
            if (first == static_cast<u8>(ClassRecord::Known)) {
                if (!m_classes.contains(uid)) return BadClass(at, "class %1 has not been described", uid);
                if (!open.empty() && m_openClasses.contains(uid))
                    return BadClass(at, "class %1 is a parent inside its own description", uid);
                if (classes) classes->push_back({{"uid", ClassText(uid)}});
                break;
            }
            if (!Number(version, "a class record")) return false;
            if (!m_classes.insert(uid).second) return BadClass(at, "class %1 is described a second time", uid);
            m_openClasses.insert(uid);
            open.push_back(uid);
            if (open.size() > c_maxNesting)
                return Damage(at, FormatT<String8>("nested deeper than %1 levels", c_maxNesting));
            Json defaults = Json::array();
            if (!WalkList(classes ? &defaults : nullptr)) return false;
            if (classes)
                classes->push_back({{"uid", ClassText(uid)}, {"version", version}, {"defaults", std::move(defaults)}});
        }
        for (u32 uid : open) m_openClasses.erase(uid);
        return true;
    }

    bool BadClass(u64 at, char const* format, u32 uid)
    {
        return Damage(at, FormatT<String8>(format, ClassText(uid).c_str()));
    }

    bool SetNull(Json* item)
    {
        if (item) (*item)["value"] = nullptr;
        return true;
    }

    // Elements of an array: what their keys would be, or null.
    template <class Step>
    bool WalkElements(u32 count, Json* item, Step step)
    {
        Json list = Json::array();
        for (; count > 0; --count) {
            Json element;
            if (!step(item ? &element : nullptr)) return false;
            if (!item) continue;
            list.push_back(element.contains("value") ? Json() : std::move(element));
        }
        if (item) (*item)["value"] = std::move(list);
        return true;
    }

    bool WalkObjects(Json* item)
    {
        u64 const at = m_source.GetTaken();
        u32 count = 0;
        if (!Number(count, "an array of objects") || !Fits(count, at, "an array of objects")) return false;
        return WalkElements(count, item, [this](Json* element) { return WalkObject(element); });
    }

    bool WalkPresence(bool& isThere)
    {
        u64 const at = m_source.GetTaken();
        u8 first = 0;
        if (!Number(first, "a class item")) return false;
        if (first > 1) return Damage(at, FormatT<String8>("byte %1 begins no class item", first));
        isThere = first == 1;
        return true;
    }

    bool WalkClassBody(u32 uid, u16 version, Json* item)
    {
        Json properties = Json::array();
        NestingGuard const level;
        if (!IsDeepEnough(level) || !WalkList(item ? &properties : nullptr)) return false;
        if (!item) return true;
        (*item)["class"] = ClassText(uid);
        (*item)["version"] = version;
        (*item)["properties"] = std::move(properties);
        return true;
    }

    bool WalkClass(Json* item)
    {
        bool isThere = false;
        u32 uid = 0;
        u16 version = 0;
        if (!WalkPresence(isThere)) return false;
        if (!isThere) return SetNull(item);
        return Number(uid, "a class item") && Number(version, "a class item") && WalkClassBody(uid, version, item);
    }

    bool WalkClasses(Json* item)
    {
        u64 const at = m_source.GetTaken();
        u32 count = 0;
        u32 uid = 0;
        u16 version = 0;
        if (!Number(count, "an array of class items") || !Number(uid, "an array of class items") ||
            !Number(version, "an array of class items") || !Fits(count, at, "an array of class items"))
            return false;
        return WalkElements(count, item, [&](Json* element) {
            bool isThere = false;
            if (!WalkPresence(isThere)) return false;
            return isThere ? WalkClassBody(uid, version, element) : SetNull(element);
        });
    }

    bool WalkDelayLoad(Json* item)
    {
        u64 const at = m_source.GetTaken();
        u32 uid = 0;
        u32 length = 0;
        if (!Number(uid, "a delay-load item") || !Number(length, "a delay-load item")) return false;
        if (!Fits(length, at, "a path")) return false;
        if (!item || length == 0 || uid == 0) return SetNull(item) && (m_source.Skip(length) || EndsIn("a path"));
        m_pool.GiveBack({});
        u8 const* const path = m_pool.AllocateRead(m_source, 0, length);
        if (!path) return EndsIn("a path");
        (*item)["class"] = ClassText(uid);
        (*item)["path"] = TextValue(path, length);
        return true;
    }

    InSerialiserSource m_source;
    PropertyStreamReport& m_report;
    InSerialiserDataPool m_pool; // For one value at a time.
    std::vector<IDTag> m_path;
    // Trees: the stream chooses the keys.
    std::set<u32> m_objects;
    std::set<u32> m_classes;
    std::set<u32> m_openClasses;
};

} // namespace

PropertyStreamReport CheckPropertyStream(InStream& in)
{
    PropertyStreamReport report;
    Walker(in, report).WalkFile(nullptr);
    return report;
}

PropertyStreamReport DumpPropertyStream(InStream& in, nlohmann::ordered_json& json)
{
    PropertyStreamReport report;
    Json root = Json::object();
    if (Walker(in, report).WalkFile(&root)) json = std::move(root);
    return report;
}

} // namespace Kernel
