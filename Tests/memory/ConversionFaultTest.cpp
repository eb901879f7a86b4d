#include "libkernel/concurrency/TimeStamp.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/core/Exception.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/StringConverter.h"
#include "libkernel/core/StringEncoding.h"
#include "libkernel/core/TextTools.h"
#include "libkernel/core/UnicodeFile.h"
#include "libkernel/core/UnicodeNormalize.h"
#include "libkernel/filesystem/FileFinder.h"
#include "libkernel/serialisation/PropertyStreamDump.h"
#include "libkernel/serialisation/SerialiseTo.h"
#include "libkernel/streams/Base64.h"
#include "libkernel/streams/MemoryStreams.h"
#include "libkernel/streams/ZStandardInStream.h"
#include "libkernel/streams/ZStandardOutStream.h"
#include "libkernel/streams/ZipInStream.h"
#include "libkernel/streams/ZipOutStream.h"
#include "libkernel/text/Collator.h"
#include "libkernel/text/PasswordText.h"
#include "libkernel/text/SearchString.h"
#include "libkernel/text/Stemmer.h"
#include "libkernel/text/StringParser.h"
#include "libkernel/text/TextCase.h"
#include "libkernel/text/TimeText.h"
#include "libkernel/text/WildcardDictionary.h"
#include "libkernel/text/WildcardSequence.h"
#include "memory/RefusedMemory.h"
#include "support/CompressionFixture.h"
#include "support/TempFolder.h"

#include <gtest/gtest.h>
#include <iostream>

// Memory that is refused at every allocation of texts and compressed streams, those that ICU, zlib and zstd make
// included. What comes out is the whole result, or an answer that says that there is none.

namespace KernelTest {
namespace {

using namespace Kernel;
using Testing::Bytes;
using PredictorType = CompressionPredictorType;
using Striping = CompressionPredictorStripingType;

std::string Std(String8 const& text)
{
    return {text.GetData(), static_cast<size_t>(text.GetLength())};
}
std::string Std(String16 const& text)
{
    return std::string(reinterpret_cast<char const*>(text.GetData()), 2 * static_cast<size_t>(text.GetLength()));
}

/// What the works take, made before anything is refused.
struct Inputs
{
    Inputs()
    {
        TestSupport::WriteWholeFile(folder / "utf16", std::string("\xFF\xFE"
                                                                  "a\0\xDF\0z\0",
                                                                  8));
        TestSupport::WriteWholeFile(folder / "latin", "Gr\xFC\xDF"
                                                      "e aus M\xFCnchen, sch\xF6n w\xE4r's\r\n");
        utf16 = String8((folder / "utf16").c_str());
        latin = String8((folder / "latin").c_str());
        inFolder = String8(folder.GetPath().c_str());
    }
    TestSupport::TempFolder folder;
    String8 utf16, latin, inFolder;
    String8 const text{"Stra\xC3\x9F"
                       "e \xC3\x84pfel A\xCC\x8A one two three, and more than fits into a short one"};
    Bytes const pixels = Testing::MakePixels(300'000, 5);
    Bytes const zlib = Testing::PeerCompress(false, pixels);
    Bytes const zstd = Testing::PeerCompress(true, pixels);
    Counted<Locale const> const german = Locale::Create(String8("de-DE"));
};

template <class Stream>
std::string Packed(Inputs const& in, PredictorType type, Striping striping, int level)
{
    auto const sink = MakeCounted<MemoryInOutStream>();
    auto const out = Stream::Create(sink, type, striping, level);
    if (!out) return "null";
    if (out->WriteBlock(in.pixels.data(), in.pixels.size()) != in.pixels.size()) return "false";
    if (!out->Finalise()) return "false";
    return std::string(static_cast<char const*>(sink->GetBuffer()), sink->GetSizeInStream());
}

template <class Stream>
std::string Unpacked(Inputs const& in, Bytes const& packed, PredictorType type, Striping striping)
{
    Counted<InStream> const source = MakeCounted<MemoryInStream>(packed.data(), packed.size(), false);
    auto const stream = Stream::Create(source, type, striping, false);
    if (!stream) return "null";
    std::string bytes(in.pixels.size(), 0);
    bool const whole = stream->ReadBlock(bytes.data(), bytes.size()) == bytes.size();
    if (whole == stream->LacksMemory()) return "damaged";
    return whole ? bytes : "false";
}

struct Work
{
    char const* name;
    std::function<std::string(Inputs const&)> run;
    char const* instead = nullptr; ///< A lesser result that its header allows.
    bool fragile = false;          ///< ICU does not stand it if memory ends inside it: refused is what comes before.
};

Work const c_works[] = {
    {"zlib out", [](Inputs const& in) { return Packed<ZipOutStream>(in, PredictorType::None, Striping::None, 9); }},
    {"zlib out, predicted",
     [](Inputs const& in) { return Packed<ZipOutStream>(in, PredictorType::UnsignedInt, Striping::Striping64k, 1); }},
    {"zstd out",
     [](Inputs const& in) { return Packed<ZStandardOutStream>(in, PredictorType::None, Striping::None, 3); }},
    {"zstd out, high level",
     [](Inputs const& in) {
         return Packed<ZStandardOutStream>(in, PredictorType::UnsignedShort, Striping::Striping64k, 12);
     }},
    {"zlib in",
     [](Inputs const& in) { return Unpacked<ZipInStream>(in, in.zlib, PredictorType::None, Striping::None); }},
    {"zstd in",
     [](Inputs const& in) { return Unpacked<ZStandardInStream>(in, in.zstd, PredictorType::None, Striping::None); }},
    {"zstd in, striped",
     [](Inputs const& in) {
         return Unpacked<ZStandardInStream>(in, in.zstd, PredictorType::UnsignedInt, Striping::Striping64k);
     }},
    {"zstd exact",
     [](Inputs const& in) -> std::string {
         std::string bytes(in.pixels.size() - 1, 0); // One byte short: the frame goes on.
         return ZStandardDecompressExact(in.zstd.data(), in.zstd.size(), bytes.data(), bytes.size(),
                                         PredictorType::UnsignedChar, Striping::Striping64k)
                    ? bytes
                    : "false";
     }},
    {"LoadAsUtf8", [](Inputs const& in) { return Std(LoadAsUtf8(in.utf16, false)); }},
    {"converter",
     [](Inputs const&) {
         StringConverter converter(String8("shift_jis"));
         return Std(converter.Convert("\x83\x65\x83\x58\x83\x67 and so on and on and on"));
     },
     "?e?X?g"},
    {"to UTF-8", [](Inputs const&) { return Std(EncodedToUtf8("caf\xE9, with more than sixteen bytes", "latin1")); }},
    {"to UTF-16", [](Inputs const&) { return Std(EncodedToUtf16("caf\xE9, with more than sixteen bytes", "utf-7")); }},
    {"from UTF-8",
     [](Inputs const& in) -> std::string {
         auto const bytes = Utf8ToEncoded(in.text, "gb18030");
         return bytes ? bytes.get() : "null";
     }},
    {"from UTF-16",
     [](Inputs const&) -> std::string {
         std::vector<char> bytes;
         std::vector<int> sources;
         bool const done = Utf16ToEncoded(bytes, sources, String16(u"\u30C6\u30B9\u30C8"), "iso-2022-jp");
         if (bytes.size() != sources.size() || (!done && !bytes.empty())) return "half done";
         return done ? std::string(bytes.begin(), bytes.end()) : "false";
     }},
    {"charset", [](Inputs const& in) { return Std(IcuCharsetDetect(in.latin)); }, nullptr, true},
    {"text file", [](Inputs const& in) { return Std(IcuLoadTextFile(in.latin, String8("windows-1252"))); }},
    {"encoding",
     [](Inputs const&) -> std::string {
         constexpr std::string_view map = "0x41 0x41\n0x80 0x20AC\n0x8140 0x3000\n";
         auto const encoding = StringEncoding::MakeFromText(String8("made"), map.data(), map.size());
         if (!encoding) return "null";
         std::vector<char> bytes;
         String8 const text = encoding->ToUnicode("A\x80\x81\x40", 4);
         return text.IsEmpty() || !encoding->FromUnicode(bytes, text, StringEncoding::ErrorPolicy::Skip, 0)
                    ? ""
                    : Std(text) + std::string(bytes.begin(), bytes.end());
     }},
    {"encoding of a file",
     [](Inputs const&) -> std::string {
         auto const encoding = StringEncoding::Make(932);
         return !encoding ? "null" : Std(encoding->ToUnicode("\x83\x65\x83\x58", 4));
     }},
    {"normal form C", [](Inputs const& in) { return Std(UNormalize(in.text, UnicodeNormalize::Composed)); }},
    {"normal form D", [](Inputs const& in) { return Std(UNormalize(in.text, UnicodeNormalize::Decomposed)); }},
    {"case",
     [](Inputs const& in) {
         return Std(ToUpperCase(in.text, in.german.Get())) + Std(ToTitleCaseSingleWord(in.text)) +
                Std(ToggleCase(in.text));
     }},
    {"search",
     [](Inputs const& in) { return std::to_string(SearchString(String8("strasse two"), true).Test(in.text)); }},
    {"collator",
     [](Inputs const& in) -> std::string {
         auto const collator = MakeCounted<Collator>(in.german, false, true);
         if (!collator->IsLocaleAware()) return "no rules";
         return std::to_string(collator->Collate(String8("\xC3\x84pfel 9"), String8("apfel 10")));
     },
     "no rules"},
    {"stemmer",
     [](Inputs const& in) -> std::string {
         auto const stemmer = MakeCounted<Stemmer>(in.german);
         return stemmer->IsValid() ? Std(stemmer->Stem(String8("Katzen"))) : "no stemmer";
     },
     "no stemmer"},
    {"time",
     [](Inputs const& in) {
         return Std(
             ToStringWithLocale(TimeStamp(1'600'000'000), TimeStampStyle::DateTime, TimeStampLocale::Utc, in.german));
     },
     nullptr, true},
    {"time by skeleton",
     [](Inputs const& in) {
         return Std(ToStringWithLocale(TimeStamp(1'600'000'000), "yMMMd", TimeStampLocale::Utc, in.german));
     },
     nullptr, true},
    {"number",
     [](Inputs const& in) -> std::string {
         double value = 0;
         return StringParser::ParseAsDouble(String8("1.234,5"), in.german, value) ? std::to_string(value) : "false";
     },
     nullptr, true},
    {"password",
     [](Inputs const& in) -> std::string {
         String8 out("untouched");
         bool const done = PreparePassword(out, in.text);
         return done ? Std(out) : out == String8("untouched") ? "false" : "half done";
     }},
    {"current locale", [](Inputs const&) { return Std(Locale::GetCurrent()->GetId()); }},
    {"format", [](Inputs const& in) { return Std(Format("%1 of %2: %1", in.text, 12.5)); }},
    {"wildcards",
     [](Inputs const& in) {
         auto const dictionary = MakeCounted<WildcardDictionary>();
         return Std(
             WildcardSequence::Parse(in.text + String8("#token that nobody knows#"), dictionary, '#')->Reform('$'));
     }},
    {"base64", [](Inputs const& in) { return Std(DecodeFromBase64(EncodeToBase64(in.text))); }},
    {"find files",
     [](Inputs const& in) {
         auto const finder = FileFinder::Create(in.inFolder, String8("utf16"));
         return !finder ? "null" : std::to_string(finder->GetPaths().size());
     }},
    {"property stream",
     [](Inputs const& in) -> std::string {
         auto const stream = MakeCounted<MemoryInOutStream>();
         auto const save = [&](OutSerialiser& out, IDTag tag) { out.SaveType(tag, in.text); };
         if (!SerialiseToStream(stream, "Sett", 1, save)) return "false";
         MemoryInStream packed(stream->GetBuffer(), stream->GetSizeInStream(), false);
         return CheckPropertyStream(packed).IsGood() ? "good" : "false";
     }},
};

std::string RunWork(Work const& work, Inputs const& in, long step)
{
    EmptyCodecPools const pools;
    std::string result;
    try {
        RefusedStep const refused(step);
        result = work.run(in);
    } catch (std::bad_alloc const&) {
        result = "memory";
    } catch (MemoryException const&) {
        result = "memory";
    }
    return result;
}

TEST(ConversionFaultTest, MemoryRefusedGivesTheWholeResultOrNone)
{
    static std::set<std::string> const none = {"memory", "null", "false", ""};
    Inputs const in;
    u64 refused = 0;
    for (Work const& work : c_works) {
        if (getenv("ONLY") && std::string(work.name) != getenv("ONLY")) continue;
        SCOPED_TRACE(work.name);
        std::string const whole = RunWork(work, in, RefusedStep::c_noStep);
        RunWork(work, in, RefusedStep::c_noStep);
        EXPECT_FALSE(none.count(whole)) << whole;
        for (long step = work.fragile ? 1 : 0; !work.fragile || step == 1; ++step) {
            SCOPED_TRACE(step);
            std::string const result = RunWork(work, in, step);
            if (!RefusedMemory::HasRefused()) break;
            ++refused;
            bool const isNamed = result == whole || none.count(result) || (work.instead && result == work.instead);
            EXPECT_TRUE(isNamed) << result.substr(0, 80);
            long const before = GetLiveBlocks();
            EXPECT_EQ(RunWork(work, in, RefusedStep::c_noStep), whole);
            RunWork(work, in, RefusedStep::c_noStep);
            RunWork(work, in, step);
            EXPECT_LT(GetLiveBlocks() - before, 2) << "blocks of memory lost";
            if (HasFailure()) break;
        }
    }
    std::cout << "Texts and compression: " << refused << " allocations refused\n";
}

} // namespace
} // namespace KernelTest
