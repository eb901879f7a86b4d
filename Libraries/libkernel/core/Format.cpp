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

// Cuts [format, end) into the pieces that the result is made of, in order, and hands each to @p piece(data, length).
// Both passes run through here, so that they cannot disagree.
template <class S, class Piece>
void ForEachPiece(typename S::Unit const* format, typename S::Unit const* const end, FormatHolderT<S> const* args,
                  u64 count, Piece piece)
{
    while (format < end) {
        auto const* const plain = format;
        while (format < end && *format != '%') ++format;
        if (format > plain) piece(plain, static_cast<u64>(format - plain));
        if (end - format < 2) return;
        ++format; // The percent sign; another unit follows.
        if (!IsDigit(*format) || *format == '0') {
            if (*format == '%') piece(format, 1);
            ++format;
            continue;
        }
        u64 index = 0;
        for (; format < end && IsDigit(*format); ++format)
            if (index <= count) index = index * 10 + static_cast<u64>(*format - '0'); // Beyond the arguments is beyond.
        if (index <= count && args[index - 1].GetLength() > 0)
            piece(args[index - 1].GetData(), static_cast<u64>(args[index - 1].GetLength()));
    }
}

} // namespace

template <class S>
int AppendFormatVT(S& out, typename S::Unit const* format, FormatHolderT<S> const* args, u64 count)
{
    using Unit = typename S::Unit;
    if (!format) {
        out = S();
        return 0;
    }
    // The format may lie in the target, whose terminator the second pass overwrites; so its end is found here.
    Unit const* const end = format + BaseCharTraits<Unit>::GetLength(format);
    int const old = out.GetLength();
    u64 const room = static_cast<u64>(std::numeric_limits<i32>::max() - old);
    u64 added = 0;
    ForEachPiece(format, end, args, count, [&](Unit const*, u64 length) {
        if (added <= room) added += length;
    });
    if (added == 0 || added > room) return 0;

    int const length = old + static_cast<int>(added);
    std::optional<S> keep;
    if (!out.HasRoomFor(length)) keep = out; // What lies in the old block stays readable while the new one is filled.
    Unit* to = out.SetLength(length) + old;
    ForEachPiece(format, end, args, count, [&](Unit const* from, u64 units) {
        std::memcpy(to, from, units * sizeof(Unit));
        to += units;
    });
    return static_cast<int>(added);
}

template KERNEL_API int AppendFormatVT<String8>(String8&, char const*, FormatHolderT<String8> const*, u64);
template KERNEL_API int AppendFormatVT<String16>(String16&, char16_t const*, FormatHolderT<String16> const*, u64);
template KERNEL_API int AppendFormatVT<String32>(String32&, unsigned int const*, FormatHolderT<String32> const*, u64);

} // namespace Kernel
