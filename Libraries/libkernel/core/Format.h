#pragma once

#include "libkernel/core/BaseCharTraits.h"
#include "libkernel/core/ConvertEnc.h"
#include "libkernel/core/DoubleText.h"

#include <new>

namespace Kernel {

/// One argument of a format call, made from a value before formatting starts: a string in any encoding, a terminated
/// array of units, an integer in decimal, or a floating-point number in its short form. Lives on the stack for the
/// length of the call. A terminated array of the target's own units is borrowed for that time; everything else is
/// copied or shared.
template <class S>
class FormatHolderT
{
public:
    using Unit = typename S::Unit;

    explicit FormatHolderT(S const& text) : m_data(text.GetData()), m_length(text.GetLength()) { Keep(text); }
    template <class Enc>
    requires(!std::same_as<StringT<Enc>, S>) explicit FormatHolderT(StringT<Enc> const& text)
    {
        Keep(ConvertedTo<typename S::EncodingType>(text));
        m_data = m_string.text.GetData();
        m_length = m_string.text.GetLength();
    }
    /// Null shows as nothing.
    explicit FormatHolderT(Unit const* text) : m_data(text), m_length(text ? BaseCharTraits<Unit>::GetLength(text) : 0)
    {
    }
    /// UTF-8 text for a wider target; null shows as nothing.
    explicit FormatHolderT(char const* text) requires(!std::same_as<Unit, char>) : FormatHolderT(String8(text)) {}
    template <TextInteger T>
    explicit FormatHolderT(T value)
    {
        m_data = NumberTextDetail::WriteDecimal(m_digits, NumberTextDetail::Split(value));
        m_length = static_cast<int>(m_digits + NumberTextDetail::c_decimalRoom - m_data);
    }
    template <TextDouble T>
    explicit FormatHolderT(T value) : m_data(m_digits), m_length(DoubleTextDetail::WriteShort(m_digits, value))
    {
        if (m_length >= 0) return;
        Keep(ToStringT<S>(value));
        m_data = m_string.text.GetData();
        m_length = m_string.text.GetLength();
    }
    FormatHolderT(FormatHolderT const&) = delete;
    FormatHolderT& operator=(FormatHolderT const&) = delete;
    ~FormatHolderT()
    {
        if (m_hasString) m_string.text.~S();
    }

    /// The units that stand for the argument, without a terminator.
    Unit const* GetData() const { return m_data; }
    int GetLength() const { return m_length; }

private:
    // A string member is made only where one is needed: making an empty one costs two atomic operations.
    union Room
    {
        Room() {}
        ~Room() {}
        S text;
    };

    void Keep(S const& text)
    {
        new (&m_string.text) S(text);
        m_hasString = true;
    }

    Unit const* m_data = nullptr;
    int m_length = 0;
    bool m_hasString = false;
    Room m_string;
    Unit m_digits[DoubleTextDetail::c_maxShortLength];
    static_assert(DoubleTextDetail::c_maxShortLength >= NumberTextDetail::c_decimalRoom);
};

/// The format engine: appends @p format to @p out, with each "%" and number replaced by the argument of that number,
/// and gives the number of units appended.
///
/// The first argument is "%1". All digits that follow belong to the number, and an argument may be used many times or
/// never. A number beyond the arguments gives nothing, "%%" gives one "%", "%" before anything else disappears
/// together with that unit, and at the very end it gives nothing. The target grows once. A null format clears the
/// target and gives 0. A text that would make the target longer than 2^31 - 1 units gives 0 and leaves the target as it
/// was. Format and arguments may lie in the target. Throws std::bad_alloc when there is no memory.
template <class S>
int AppendFormatVT(S& out, typename S::Unit const* format, FormatHolderT<S> const* args, u64 count);

/// The formatted text as a new string; the empty string for a null format and for a text that is too long.
template <class S>
S FormatVT(typename S::Unit const* format, FormatHolderT<S> const* args, u64 count);

extern template KERNEL_API int AppendFormatVT<String8>(String8&, char const*, FormatHolderT<String8> const*, u64);
extern template KERNEL_API int AppendFormatVT<String16>(String16&, char16_t const*, FormatHolderT<String16> const*,
                                                        u64);
extern template KERNEL_API int AppendFormatVT<String32>(String32&, unsigned int const*, FormatHolderT<String32> const*,
                                                        u64);

extern template KERNEL_API String8 FormatVT(char const*, FormatHolderT<String8> const*, u64);
extern template KERNEL_API String16 FormatVT(char16_t const*, FormatHolderT<String16> const*, u64);
extern template KERNEL_API String32 FormatVT(unsigned int const*, FormatHolderT<String32> const*, u64);

/// AppendFormatVT with the arguments given one by one.
template <class S, class... Args>
int AppendFormatT(S& out, typename S::Unit const* format, Args const&... args)
{
    if constexpr (sizeof...(Args) == 0)
        return AppendFormatVT<S>(out, format, nullptr, 0);
    else {
        FormatHolderT<S> const holders[] = {FormatHolderT<S>(args)...};
        return AppendFormatVT<S>(out, format, holders, sizeof...(Args));
    }
}
/// FormatVT likewise.
template <class S, class... Args>
S FormatT(typename S::Unit const* format, Args const&... args)
{
    if constexpr (sizeof...(Args) == 0)
        return FormatVT<S>(format, nullptr, 0);
    else {
        FormatHolderT<S> const holders[] = {FormatHolderT<S>(args)...};
        return FormatVT<S>(format, holders, sizeof...(Args));
    }
}

/// AppendFormatT for String8.
template <class... Args>
int AppendFormat(String8& out, char const* format, Args const&... args)
{
    return AppendFormatT<String8>(out, format, args...);
}
template <class... Args>
int AppendFormat(String8& out, String8 const& format, Args const&... args)
{
    return AppendFormatT<String8>(out, format.GetData(), args...);
}
/// The formatted text; the empty string for a null format.
template <class... Args>
String8 Format(char const* format, Args const&... args)
{
    return FormatT<String8>(format, args...);
}
template <class... Args>
String8 Format(String8 const& format, Args const&... args)
{
    return FormatT<String8>(format.GetData(), args...);
}

} // namespace Kernel
