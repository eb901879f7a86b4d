#include "libkernel/text/TextCase.h"

#include "libkernel/core/CaseTable.h"
#include "libkernel/core/CharTraits.h"

#include <limits>
#include <new>
#include <unicode/uchar.h>

namespace Kernel {
namespace {

using Operation = CaseTable::Operation;

CaseTable const& GetTable(Operation operation, NonCounted<Locale const> locale)
{
    return CaseTable::Get(operation, locale ? locale->GetId().GetData() : "");
}

// Calls @p take with what each code point becomes. @p choose gives its table, from the code point and whether it is the
// first. A code point that is cut short at the end is left out.
template <class Enc, class Choose, class Take>
void ForEachMapped(StringT<Enc> const& text, Choose&& choose, Take&& take)
{
    using Traits = CharTraits<Enc>;
    auto const* p = text.begin();
    while (p < text.end() && Traits::GetCodePointLength(*p) <= text.end() - p) {
        bool const isFirst = p == text.begin();
        u32 const codePoint = Traits::NextCodePoint(p);
        u32 mapped[CaseTable::c_longest];
        take(codePoint, mapped, choose(codePoint, isFirst).Map(codePoint, mapped));
    }
}

template <class Enc, class Choose>
StringT<Enc> Mapped(StringT<Enc> const& text, Choose&& choose)
{
    using Traits = CharTraits<Enc>;
    u64 length = 0;
    bool isSame = true;
    ForEachMapped(text, choose, [&](u32 codePoint, u32 const* mapped, int count) {
        isSame &= count == 1 && *mapped == codePoint;
        for (int i = 0; i < count; ++i) length += static_cast<u32>(Traits::GetCodePointLength(mapped[i]));
    });
    if (isSame && length == static_cast<u64>(text.GetLength())) return text;
    if (length > static_cast<u64>(std::numeric_limits<i32>::max())) throw std::bad_alloc();
    typename Enc::Unit* to;
    StringT<Enc> result(static_cast<int>(length), to);
    ForEachMapped(text, choose, [&](u32, u32 const* mapped, int count) {
        for (int i = 0; i < count; ++i) to = Traits::AppendCodePoint(to, mapped[i]);
    });
    return result;
}

} // namespace

template <class Enc>
StringT<Enc> ToLowerCase(StringT<Enc> const& text, NonCounted<Locale const> locale)
{
    CaseTable const& lower = GetTable(Operation::Lower, locale);
    return Mapped(text, [&](u32, bool) -> CaseTable const& { return lower; });
}

template <class Enc>
StringT<Enc> ToUpperCase(StringT<Enc> const& text, NonCounted<Locale const> locale)
{
    CaseTable const& upper = GetTable(Operation::Upper, locale);
    return Mapped(text, [&](u32, bool) -> CaseTable const& { return upper; });
}

template <class Enc>
StringT<Enc> ToTitleCaseSingleWord(StringT<Enc> const& text, NonCounted<Locale const> locale)
{
    CaseTable const& title = GetTable(Operation::Title, locale);
    CaseTable const& lower = GetTable(Operation::Lower, locale);
    return Mapped(text, [&](u32, bool isFirst) -> CaseTable const& { return isFirst ? title : lower; });
}

template <class Enc>
StringT<Enc> ToggleCase(StringT<Enc> const& text, NonCounted<Locale const> locale)
{
    CaseTable const& lower = GetTable(Operation::Lower, locale);
    CaseTable const& upper = GetTable(Operation::Upper, locale);
    return Mapped(text, [&](u32 codePoint, bool) -> CaseTable const& {
        return u_isupper(static_cast<UChar32>(codePoint)) ? lower : upper;
    });
}

template String8 ToLowerCase(String8 const&, NonCounted<Locale const>);
template String16 ToLowerCase(String16 const&, NonCounted<Locale const>);
template String32 ToLowerCase(String32 const&, NonCounted<Locale const>);
template String8 ToUpperCase(String8 const&, NonCounted<Locale const>);
template String16 ToUpperCase(String16 const&, NonCounted<Locale const>);
template String32 ToUpperCase(String32 const&, NonCounted<Locale const>);
template String8 ToTitleCaseSingleWord(String8 const&, NonCounted<Locale const>);
template String16 ToTitleCaseSingleWord(String16 const&, NonCounted<Locale const>);
template String32 ToTitleCaseSingleWord(String32 const&, NonCounted<Locale const>);
template String8 ToggleCase(String8 const&, NonCounted<Locale const>);
template String16 ToggleCase(String16 const&, NonCounted<Locale const>);
template String32 ToggleCase(String32 const&, NonCounted<Locale const>);

} // namespace Kernel
