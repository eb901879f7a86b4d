#include "FuzzTarget.h"
#include "libkernel/core/CharTraits.h"
#include "libkernel/core/StringEncoding.h"

#include <algorithm>
#include <vector>

namespace {

using namespace Kernel;
using Kernel::Fuzz::Require;

// Each code goes to a code point that UTF-8 can write, and each code point comes back from its code.
void CheckTables(StringEncoding const& encoding)
{
    for (u32 code = 0; code <= 0xFFFF; code = code < 0x200 ? code + 1 : code + 17) {
        u32 const codePoint = encoding.ToUnicode(code);
        Require(codePoint <= 0x10FFFF && (codePoint & 0xFFFFF800) != 0xD800, "a code point is one");
        if (codePoint == StringEncoding::c_noCode) continue;
        u32 const back = encoding.FromUnicode(codePoint, StringEncoding::c_noCode);
        Require(encoding.ToUnicode(back) == codePoint, "a code point comes back");
    }
    for (int byte = 0; byte < 256; ++byte)
        Require(!encoding.IsLeadByte(static_cast<u8>(byte)) || (encoding.IsVariableLength() && byte != 0),
                "lead bytes have codes");
}

} // namespace

// The input is a mapping file, and then its own bytes are read by the encoding that it makes.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    char const* const text = reinterpret_cast<char const*>(data);
    auto const encoding = StringEncoding::MakeFromText("fuzz", text, size);
    CheckTables(*encoding);
    int const length = static_cast<int>(std::min<size_t>(size, 1 << 16));
    String8 const decoded = encoding->ToUnicode(text, length);
    Require(CharTraits<TEncUtf8>::IsValid(decoded.GetData(), decoded.GetLength(), true), "the text is valid");
    std::vector<char> codes;
    encoding->FromUnicode(codes, decoded, StringEncoding::ErrorPolicy::WriteFallback, '?');
    return 0;
}
