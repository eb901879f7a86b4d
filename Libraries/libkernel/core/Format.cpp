#include "libkernel/core/Format.h"

#include <cstring>
#include <limits>
#include <optional>

namespace Kernel {
namespace {

template <class Unit>
bool IsDigit(Unit unit)
{
    return unit >= '0' && unit <= '9';
}

// Cuts the format into the pieces that the result is made of, in order, and hands each to @p piece(data, length); stops
// at the terminator or, once that is known, at @p end. Gives the end. Both passes run through here, so that they cannot
// disagree.
template <class S, class Piece>
auto ForEachPiece(typename S::Unit const* format, typename S::Unit const* const end, FormatHolderT<S> const* args,
                  u64 count, Piece piece) -> typename S::Unit const*
{
    auto const atEnd = [&] { return format == end || *format == 0; };
    while (!atEnd()) {
        auto const* const plain = format;
        while (!atEnd() && *format != '%') ++format;
        if (format > plain) piece(plain, static_cast<u64>(format - plain));
        if (atEnd()) break;
        ++format; // The percent sign.
        if (atEnd()) break;
        if (!IsDigit(*format) || *format == '0') {
            if (*format == '%') piece(format, 1);
            ++format;
            continue;
        }
        u64 index = 0;
        for (; !atEnd() && IsDigit(*format); ++format)
            if (index <= count) index = index * 10 + static_cast<u64>(*format - '0'); // Beyond the arguments is beyond.
        if (index <= count && args[index - 1].GetLength() > 0)
            piece(args[index - 1].GetData(), static_cast<u64>(args[index - 1].GetLength()));
    }
    return format;
}

// A format that has been cut and measured, so that its text can be written without a second look at it; a long one is
// cut again.
template <class S>
class MeasuredFormat
{
public:
    using Unit = typename S::Unit;

    MeasuredFormat(Unit const* format, FormatHolderT<S> const* args, u64 count)
        : m_format(format), m_args(args), m_count(count)
    {
        m_end = ForEachPiece(format, static_cast<Unit const*>(nullptr), args, count, [&](Unit const* data, u64 length) {
            if (m_pieceCount < c_kept) m_pieces[m_pieceCount] = {data, length};
            ++m_pieceCount;
            if (m_length <= c_maxLength) m_length += length;
        });
    }

    /// Units of the text; above c_maxLength if it is longer than any string can be.
    u64 GetLength() const { return m_length; }

    void Write(Unit* to) const
    {
        auto const write = [&](Unit const* from, u64 length) {
            std::memcpy(to, from, length * sizeof(Unit));
            to += length;
        };
        if (m_pieceCount <= c_kept)
            for (u64 i = 0; i < m_pieceCount; ++i) write(m_pieces[i].data, m_pieces[i].length);
        else
            ForEachPiece(m_format, m_end, m_args, m_count, write);
    }

    static constexpr u64 c_maxLength = std::numeric_limits<i32>::max();

private:
    struct Piece
    {
        Unit const* data;
        u64 length;
    };
    static constexpr u64 c_kept = 12;

    Unit const* const m_format;
    Unit const* m_end; // The terminator may lie in the target, where writing goes over it.
    FormatHolderT<S> const* const m_args;
    u64 const m_count;
    u64 m_length = 0;
    u64 m_pieceCount = 0;
    Piece m_pieces[c_kept];
};

} // namespace

template <class S>
int AppendFormatVT(S& out, typename S::Unit const* format, FormatHolderT<S> const* args, u64 count)
{
    if (!format) {
        out = S();
        return 0;
    }
    MeasuredFormat<S> const text(format, args, count);
    int const old = out.GetLength();
    if (text.GetLength() == 0 || text.GetLength() > text.c_maxLength - static_cast<u64>(old)) return 0;

    int const added = static_cast<int>(text.GetLength());
    std::optional<S> keep;
    if (!out.HasRoomFor(old + added)) keep = out; // What lies in the old block stays readable until it is copied.
    text.Write(out.SetLength(old + added) + old);
    return added;
}

template <class S>
S FormatVT(typename S::Unit const* format, FormatHolderT<S> const* args, u64 count)
{
    if (!format) return S();
    MeasuredFormat<S> const text(format, args, count);
    if (text.GetLength() > text.c_maxLength) return S();
    typename S::Unit* to;
    S result(static_cast<int>(text.GetLength()), to);
    text.Write(to);
    return result;
}

template KERNEL_API int AppendFormatVT<String8>(String8&, char const*, FormatHolderT<String8> const*, u64);
template KERNEL_API int AppendFormatVT<String16>(String16&, char16_t const*, FormatHolderT<String16> const*, u64);
template KERNEL_API int AppendFormatVT<String32>(String32&, unsigned int const*, FormatHolderT<String32> const*, u64);
template KERNEL_API String8 FormatVT(char const*, FormatHolderT<String8> const*, u64);
template KERNEL_API String16 FormatVT(char16_t const*, FormatHolderT<String16> const*, u64);
template KERNEL_API String32 FormatVT(unsigned int const*, FormatHolderT<String32> const*, u64);

} // namespace Kernel
