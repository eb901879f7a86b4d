#include "FuzzTarget.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/StringConverter.h"
#include "libkernel/core/StringEncoding.h"
#include "libkernel/core/UnicodeFile.h"

#include <string>
#include <vector>

namespace {

using namespace Kernel;
using Kernel::Fuzz::Require;

bool IsValid(String8 const& text)
{
    return CharTraits<TEncUtf8>::IsValid(text.GetData(), text.GetLength(), true);
}

constexpr CodePage c_pages[] = {0, 2, 932, 949, 950, 1252, 10001, 10003, 10005};
constexpr char const* c_charsets[] = {"UTF-8", "windows-1252", "Shift_JIS", "ISO-2022-JP", "gb18030", "UTF-16",
                                      "UTF-7", "SCSU",         "BOCU-1",    "HZ-GB-2312",  "EUC-KR",  "no such"};

void ReadForms(u8 const* data, i64 size, bool allowZero)
{
    GetByteOrderMark(data, size);
    for (int form = 0; form <= 11; ++form) {
        String8 const text = ConvertToUtf8(static_cast<UnicodeEncoding>(form), data, size, allowZero);
        Require(CharTraits<TEncUtf8>::IsValid(text.GetData(), text.GetLength(), allowZero), "a form gives valid text");
    }
}

void ReadLegacy(StringEncoding const& encoding, char const* bytes, int size)
{
    String8 const text = encoding.ToUnicode(bytes, size);
    Require(IsValid(text), "an encoding gives valid text");
    encoding.ToUnicodeSingle(bytes, size < 2 ? size : 2);
    std::vector<char> codes;
    if (encoding.FromUnicode(codes, text, StringEncoding::ErrorPolicy::Skip, 0) && !encoding.IsIdentity())
        Require(encoding.ToUnicode(codes.data(), static_cast<int>(codes.size())) == text, "what has a code comes back");
    codes.clear();
    encoding.FromUnicode(codes, String8(bytes, size), StringEncoding::ErrorPolicy::WriteFallback, '?');
}

void ReadCharset(char const* charset, std::string const& bytes)
{
    String8 const text = EncodedToUtf8(bytes.c_str(), charset);
    Require(IsValid(text), "a charset gives valid text");
    Require(EncodedToUtf16(bytes.c_str(), charset) == ConvertedTo<TEncUtf16>(text), "both widths say the same");
    Utf8ToEncoded(String8(bytes.data(), static_cast<int>(bytes.size())), charset);
    std::vector<char> codes;
    std::vector<int> sources;
    Utf16ToEncoded(codes, sources, ConvertedTo<TEncUtf16>(text), charset);
    Require(codes.size() == sources.size(), "each byte has its source");
}

} // namespace

// Bytes of the input: a code page, a charset, whether zeros are allowed, then a text in whatever encoding.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    Fuzz::Input input(data, size);
    CodePage const page = c_pages[input.TakeBelow(std::size(c_pages))];
    char const* const charset = c_charsets[input.TakeBelow(std::size(c_charsets))];
    bool const allowZero = input.TakeBool();
    std::string const bytes(reinterpret_cast<char const*>(input.GetRest()), input.GetLeft());
    ReadForms(reinterpret_cast<u8 const*>(bytes.data()), static_cast<i64>(bytes.size()), allowZero);
    ReadLegacy(*StringEncoding::Make(page), bytes.data(), static_cast<int>(bytes.size()));
    ReadCharset(charset, bytes);
    return 0;
}
