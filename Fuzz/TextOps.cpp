#include "FuzzTarget.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/Format.h"
#include "libkernel/core/TextTools.h"
#include "libkernel/core/UnicodeClasses.h"
#include "libkernel/core/Utf8Sequence.h"

#include <string>

namespace {

using namespace Kernel;
using Kernel::Fuzz::Require;
using Utf8 = CharTraits<TEncUtf8>;

bool IsValid(String8 const& text)
{
    return Utf8::IsValid(text.GetData(), text.GetLength(), true);
}

// Whatever the bytes are: no reader goes past them, and what is cut at the valid length stays what it is.
void CheckAnyBytes(String8 const& text)
{
    int const valid = Utf8::GetValidLength(text.GetData(), text.GetLength(), true);
    Require(valid <= text.GetLength(), "the valid length lies inside");
    ConvertedTo<TEncUtf16>(text);
    ConvertedTo<TEncUtf32>(text);
    Utf8Sequence sequence;
    for (char const* p = text.begin(); p < text.end(); ++p) {
        int const read = sequence.Set(p);
        Require(read <= text.end() - p + (*p == 0), "a sequence ends before the terminator");
    }
    // The format is any bytes; arguments in all widths.
    String8 const first = text.GetSubstring(0, 16);
    Format(text.GetData(), first, -42, 0.1,
           ConvertedTo<TEncUtf16>(
               String8(first.GetData(), Utf8::GetValidLength(first.GetData(), first.GetLength(), true))));
}

void CheckValidText(String8 text)
{
    Require(IsValid(CanonicaliseLineEnds(text)), "line ends leave valid text");
    String8 const lines = CanonicaliseLineEnds(text);
    Require(lines.Find('\r') < 0 && CanonicaliseLineEnds(lines) == lines, "line ends are made once");
    Require(IsValid(EscapeXml(text.begin(), text.end())), "escapes leave valid text");
    for (char const* p = text.begin(); p < text.end();) {
        u32 const codePoint = Utf8::NextCodePoint(p);
        IsPunct(codePoint);
        GetUnicodeName(codePoint);
        u32 parts[2];
        Require(GetUnicodeDecomposition(parts, 2, codePoint) <= 2, "parts stay in their room");
    }
    ApplyMaxWordCount(text, 3, true);
    Require(IsValid(text), "a cut leaves valid text");
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    if (size > 1 << 16) return 0;
    String8 const text(reinterpret_cast<char const*>(data), static_cast<int>(size));
    CheckAnyBytes(text);
    CheckValidText(text.GetSubstring(0, Utf8::GetValidLength(text.GetData(), text.GetLength(), true)));
    return 0;
}
