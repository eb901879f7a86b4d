#include "libkernel/streams/Base64.h"

#include <algorithm>
#include <array>
#include <limits>

namespace Kernel {

namespace {

constexpr char c_alphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr char c_padding = '=';
constexpr int c_encodeSlice = 768; // Bytes; a multiple of 3, so that no padding falls inside.
constexpr int c_decodeSlice = 1024;
constexpr u8 c_outside = 0xFF;

constexpr std::array<u8, 256> MakeValues()
{
    std::array<u8, 256> values{};
    values.fill(c_outside);
    for (u8 i = 0; i < 64; ++i) values[static_cast<u8>(c_alphabet[i])] = i;
    return values;
}

constexpr std::array<u8, 256> c_values = MakeValues();

constexpr u64 EncodedSize(u64 count)
{
    return (count + 2) / 3 * 4;
}

void EncodeAll(char* to, u8 const* from, u64 count)
{
    for (; count >= 3; count -= 3, from += 3, to += 4) {
        u32 const group = u32(from[0]) << 16 | u32(from[1]) << 8 | from[2];
        to[0] = c_alphabet[group >> 18];
        to[1] = c_alphabet[group >> 12 & 63];
        to[2] = c_alphabet[group >> 6 & 63];
        to[3] = c_alphabet[group & 63];
    }
    if (!count) return;
    u32 const group = u32(from[0]) << 16 | (count == 2 ? u32(from[1]) << 8 : 0);
    to[0] = c_alphabet[group >> 18];
    to[1] = c_alphabet[group >> 12 & 63];
    to[2] = count == 2 ? c_alphabet[group >> 6 & 63] : c_padding;
    to[3] = c_padding;
}

// Takes characters one at a time and gives a byte whenever eight bits have come together.
struct Decoder
{
    enum class Step
    {
        Nothing,
        Byte,
        End
    };

    Step Take(char c)
    {
        if (c == c_padding) return Step::End;
        u8 const value = c_values[static_cast<u8>(c)];
        if (value == c_outside) return Step::Nothing;
        bits = bits << 6 | value;
        held += 6;
        if (held < 8) return Step::Nothing;
        held -= 8;
        byte = static_cast<char>(bits >> held);
        return Step::Byte;
    }

    u32 bits = 0;
    int held = 0;
    char byte = 0;
};

} // namespace

int EncodeToBase64(char* to, int size, char const* from, int count)
{
    if (count <= 0 || size < 0) return 0;
    u64 const needed = EncodedSize(static_cast<u64>(count));
    if (needed > static_cast<u64>(size)) return 0;
    EncodeAll(to, reinterpret_cast<u8 const*>(from), static_cast<u64>(count));
    return static_cast<int>(needed);
}

String8 EncodeToBase64(String8 const& text)
{
    String8 result;
    int const count = text.GetLength();
    u64 const needed = EncodedSize(static_cast<u64>(count));
    if (needed == 0 || needed > static_cast<u64>(std::numeric_limits<int>::max()) - 64) return result;
    EncodeAll(result.SetLength(static_cast<int>(needed)), reinterpret_cast<u8 const*>(text.GetData()),
              static_cast<u64>(count));
    return result;
}

void EncodeToBase64(OutStream& out, char const* from, int count)
{
    char text[EncodedSize(c_encodeSlice)];
    for (int slice; count > 0; from += slice, count -= slice) {
        slice = std::min(count, c_encodeSlice);
        u64 const length = static_cast<u64>(EncodeToBase64(text, sizeof text, from, slice));
        if (out.WriteBlock(text, length) != length) return;
    }
}

int DecodeFromBase64(char* to, int size, char const* from, int count)
{
    Decoder decoder;
    int written = 0;
    for (int i = 0; i < count; ++i) {
        Decoder::Step const step = decoder.Take(from[i]);
        if (step == Decoder::Step::End) break;
        if (step == Decoder::Step::Nothing) continue;
        if (written >= size) return 0;
        to[written++] = decoder.byte;
    }
    return written;
}

String8 DecodeFromBase64(String8 const& text)
{
    String8 result;
    int const room = text.GetLength() / 4 * 3;
    char* const to = result.SetLength(room);
    result.SetLength(DecodeFromBase64(to, room, text.GetData(), text.GetLength()));
    return result;
}

void DecodeFromBase64(OutStream& out, char const* from, int count)
{
    Decoder decoder;
    char bytes[c_decodeSlice];
    u64 held = 0;
    for (int i = 0; i < count; ++i) {
        Decoder::Step const step = decoder.Take(from[i]);
        if (step == Decoder::Step::End) break;
        if (step == Decoder::Step::Nothing) continue;
        bytes[held++] = decoder.byte;
        if (held < sizeof bytes) continue;
        if (out.WriteBlock(bytes, held) != held) return;
        held = 0;
    }
    if (held) out.WriteBlock(bytes, held);
}

Base64OutStream::Base64OutStream(Counted<OutStream> target) : GatheringOutStream(std::move(target), c_rawBlockSize) {}

Base64OutStream::~Base64OutStream()
{
    FlushTail();
}

bool Base64OutStream::FlushBase64(OutStream& target, char const* from, u32 count)
{
    char text[EncodedSize(c_rawBlockSize)];
    u64 const length = EncodedSize(count);
    EncodeAll(text, reinterpret_cast<u8 const*>(from), count);
    return target.WriteBlock(text, length) == length;
}

} // namespace Kernel
