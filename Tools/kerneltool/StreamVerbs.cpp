#include "Diagnostics.h"
#include "Output.h"
#include "Verbs.h"
#include "libkernel/serialisation/PropertyStreamDump.h"
#include "libkernel/streams/FastFileInStream.h"
#include "libkernel/streams/FileInStream.h"
#include "libkernel/streams/ZipInStream.h"

// A look at property streams on the wire.

namespace KernelTool {

using namespace Kernel;

namespace {

constexpr u64 c_bufferSize = 1 << 16;

Counted<InStream> OpenStream(Arguments const& arguments)
{
    String8 const path = arguments.At(0);
    File::OpenUnmanagedResult result{};
    Counted<FileInStream> const plain = FileInStream::OpenEx(path.GetData(), result);
    if (!plain) throw MakeFailure("opening '" + ToStd(path) + "'", result);
    Counted<InStream> stream = FastFileInStream::Open(path.GetData(), c_bufferSize);
    if (!stream) stream = plain;
    if (!arguments.Has(Option::Zlib)) return stream;
    Counted<InStream> const unpacked =
        ZipInStream::Create(stream, CompressionPredictorType::None, CompressionPredictorStripingType::None, false);
    if (!unpacked) throw MakeFailure("opening '" + ToStd(path) + "'", File::OpenUnmanagedResult::NoMemory);
    return unpacked;
}

char const* NameOf(PropertyStreamReport::Result result)
{
    static constexpr char const* c_names[] = {"Good", "NotAStream", "Newer", "Damaged"};
    return c_names[static_cast<int>(result)];
}

std::string Where(PropertyStreamReport const& report)
{
    std::string text = "At byte " + std::to_string(report.offset);
    if (!report.path.IsEmpty()) text += " in " + ToStd(report.path);
    return text + ": " + ToStd(report.reason);
}

struct TypeRow
{
    int first;
    int last;
    char const* name;
};

constexpr TypeRow c_typeNames[] = {
    {1, 1, "u8"},
    {2, 2, "u16"},
    {3, 3, "u32"},
    {4, 4, "u64"},
    {5, 5, "i8"},
    {6, 6, "i16"},
    {7, 7, "i32"},
    {8, 8, "i64"},
    {9, 9, "float"},
    {10, 10, "double"},
    {11, 40, "vector"},
    {41, 41, "bool"},
    {42, 42, "enum"},
    {43, 43, "string"},
    {44, 44, "custom"},
    {45, 45, "raw data"},
    {46, 46, "string"},
    {47, 47, "tag"},
    {48, 48, "stream"},
    {49, 49, "object"},
    {50, 50, "class"},
    {51, 51, "delay load"},
    {52, 52, "class code"},
    {53, 116, "struct"},
    {117, 117, "flags"},
    {118, 118, "fragmented data"},
    {119, 119, "aligned data"},
};

std::string TypeName(int type)
{
    for (TypeRow const& row : c_typeNames)
        if (type >= row.first && type <= row.last) return row.name;
    return std::to_string(type);
}

std::string Compact(Json const& value)
{
    constexpr size_t longest = 160;
    std::string text = value.dump(-1, ' ', false, Json::error_handler_t::replace);
    if (text.size() > longest) text = text.substr(0, longest - 3) + "...";
    return text;
}

void ShowList(Json const& list, size_t depth, std::string& text);

/// One item, or one element of an array of objects; what is nested goes on the lines below.
void ShowItem(Json const& item, size_t depth, std::string& text)
{
    std::string const indent(depth * 2, ' ');
    text += indent;
    if (item.contains("tag")) text += Printable(item["tag"].get<std::string>()) + "  ";
    if (item.contains("type")) text += TypeName(item["type"].get<int>()) + (item.contains("array") ? "[]" : "") + "  ";
    if (item.contains("object")) text += "#" + std::to_string(item["object"].get<u64>()) + " ";
    if (item.contains("ref")) text += "-> #" + std::to_string(item["ref"].get<u64>());
    if (item.contains("class")) text += Printable(item["class"].get<std::string>()) + " ";
    if (item.contains("path")) text += Compact(item["path"]);
    if (item.contains("classes")) {
        bool first = true;
        for (Json const& description : item["classes"]) {
            text += (first ? "" : " : ") + Printable(description["uid"].get<std::string>());
            if (description.contains("version")) text += " v" + std::to_string(description["version"].get<u64>());
            first = false;
        }
    } else if (item.contains("version") && !item.contains("value")) {
        text += "v" + std::to_string(item["version"].get<u64>());
    }
    Json const* const value = item.contains("value") ? &item["value"] : nullptr;
    bool const objects =
        value && value->is_array() && !value->empty() && item["type"].get<int>() >= 48 && item["type"].get<int>() <= 51;
    bool const stream = value && value->is_object() && value->contains("items");
    if (value && !objects && !stream) text += Compact(*value);
    if (stream) text += "v" + std::to_string((*value)["version"].get<u64>());
    text += "\n";
    if (objects)
        for (Json const& element : *value) {
            if (element.is_null())
                text += indent + "  null\n";
            else
                ShowItem(element, depth + 1, text);
        }
    if (stream) ShowList((*value)["items"], depth + 1, text);
    if (item.contains("classes"))
        for (Json const& description : item["classes"])
            if (description.contains("defaults") && !description["defaults"].empty()) {
                text += indent + "  defaults of " + Printable(description["uid"].get<std::string>()) + "\n";
                ShowList(description["defaults"], depth + 2, text);
            }
    if (item.contains("properties")) ShowList(item["properties"], depth + 1, text);
}

void ShowList(Json const& list, size_t depth, std::string& text)
{
    for (Json const& item : list) ShowItem(item, depth, text);
}

Failure DescribeReport(std::string const& what, PropertyStreamReport const& report)
{
    return {what, NameOf(report.result), static_cast<int>(report.result), Where(report), ExitFailed};
}

} // namespace

int RunStreamDump(Arguments const& arguments)
{
    Counted<InStream> const stream = OpenStream(arguments);
    Json dump;
    PropertyStreamReport const report = DumpPropertyStream(*stream, dump);
    if (!report.IsGood()) throw DescribeReport("dumping '" + arguments.positional[0] + "'", report);
    if (arguments.Has(Option::Json)) {
        PrintJson(dump);
        return ExitDone;
    }
    std::string text = "kind " + Printable(dump["fileTag"].get<std::string>()) + ", format version " +
                       std::to_string(dump["formatVersion"].get<u64>()) + ", file version " +
                       std::to_string(dump["fileVersion"].get<u64>()) + ", build index " +
                       std::to_string(dump["buildIndex"].get<u64>()) + "\n";
    ShowList(dump["properties"], 0, text);
    Print(text);
    return ExitDone;
}

int RunStreamCheck(Arguments const& arguments)
{
    Counted<InStream> const stream = OpenStream(arguments);
    PropertyStreamReport const report = CheckPropertyStream(*stream);
    if (arguments.Has(Option::Json))
        PrintJson({{"result", static_cast<int>(report.result)},
                   {"name", NameOf(report.result)},
                   {"offset", report.offset},
                   {"path", ToStd(report.path)},
                   {"reason", ToStd(report.reason)}});
    else
        Print(report.IsGood() ? "sound, " + std::to_string(report.offset) + " bytes\n"
                              : Printable(Where(report)) + "\n");
    if (report.IsGood()) return ExitDone;
    PrintFailure(DescribeReport("checking '" + arguments.positional[0] + "'", report));
    return ExitDamaged;
}

} // namespace KernelTool
