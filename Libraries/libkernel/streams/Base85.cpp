#include "libkernel/streams/Base85.h"

#include <algorithm>
#include <cstring>
#include <string_view>

namespace Kernel {

namespace {

constexpr int c_lineLength = 75;
constexpr int c_encodeSlice = 1200;                           // Bytes; a multiple of 4, so that no tail falls inside.
constexpr int c_encodedSliceSize = 1540;                      // Its groups, and 20 line ends of two characters.
constexpr std::string_view c_lineEnds[] = {"", "\n", "\r\n"}; // By line mode.

std::string_view LineEnd(int lineMode)
{
    return lineMode > 0 && lineMode < static_cast<int>(std::size(c_lineEnds)) ? c_lineEnds[lineMode] : c_lineEnds[0];
}

// One group of 1 to 4 bytes; gives its characters.
int EncodeGroup(char* digits, u8 const* from, int count)
{
    u32 value = 0;
    for (int i = 0; i < 4; ++i) value = value << 8 | (i < count ? from[i] : 0u);
    if (value == 0 && count == 4) {
        digits[0] = 'z';
        return 1;
    }
    for (int i = 4; i >= 0; --i, value /= 85) digits[i] = static_cast<char>('!' + value % 85);
    return count + 1;
}

bool EncodeSlices(OutStream& out, char const* from, int count, int& column, int lineMode)
{
    char text[c_encodedSliceSize];
    for (int slice; count > 0; from += slice, count -= slice) {
        slice = std::min(count, c_encodeSlice);
        u64 const length = static_cast<u64>(EncodeToBase85(text, sizeof text, from, slice, column, lineMode));
        if (out.WriteBlock(text, length) != length) return false;
    }
    return true;
}

} // namespace

int EncodeToBase85(char* to, int size, char const* from, int count, int& column, int lineMode)
{
    std::string_view const lineEnd = LineEnd(lineMode);
    int written = 0;
    int place = column;
    for (i64 i = 0; i < count; i += 4) {
        char group[5 + 2];
        int length =
            EncodeGroup(group, reinterpret_cast<u8 const*>(from) + i, static_cast<int>(std::min<i64>(count - i, 4)));
        place += length;
        if (place >= c_lineLength) {
            place = 0;
            length += static_cast<int>(lineEnd.copy(group + length, 2));
        }
        if (length > size - written) return 0;
        std::memcpy(to + written, group, static_cast<size_t>(length));
        written += length;
    }
    column = place;
    return written;
}

void EncodeToBase85(OutStream& out, char const* from, int count, int lineMode)
{
    int column = 0;
    EncodeSlices(out, from, count, column, lineMode);
}

Base85OutStream::Base85OutStream(Counted<OutStream> target, int lineMode)
    : GatheringOutStream(std::move(target), c_rawBlockSize), m_lineMode(lineMode)
{
}

Base85OutStream::~Base85OutStream()
{
    FlushTail();
}

bool Base85OutStream::FlushBase85(OutStream& target, char const* from, u32 count)
{
    return EncodeSlices(target, from, static_cast<int>(count), m_column, m_lineMode);
}

} // namespace Kernel
