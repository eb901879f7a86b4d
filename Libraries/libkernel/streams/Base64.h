#pragma once

#include "libkernel/core/String.h"
#include "libkernel/streams/GatheringOutStream.h"

namespace Kernel {

// Base64 of RFC 4648, section 4: the standard alphabet, padded with '=', no line ends.

/// Encodes @p count bytes and gives the characters written: 4 for each 3 bytes begun. No terminator. 0 if they don't
/// fit in @p size characters, or @p count is not positive.
KERNEL_API int EncodeToBase64(char* to, int size, char const* from, int count);
/// Empty for the empty text, and where the result would pass 2^31 - 1 characters.
KERNEL_API String8 EncodeToBase64(String8 const& text);
/// Encodes onto @p out in slices. Ends at the first slice that @p out does not take whole; how far it came shows in
/// the stream's own position.
KERNEL_API void EncodeToBase64(OutStream& out, char const* from, int count);

/// Decodes @p count characters and gives the bytes written. Characters outside the alphabet are skipped; the first '='
/// ends the text. Bits at the end that fill no byte are dropped. 0 if the bytes don't fit in @p size.
KERNEL_API int DecodeFromBase64(char* to, int size, char const* from, int count);
/// Room is made for 3 bytes per 4 characters, so a text whose padding was cut off gives the empty string.
KERNEL_API String8 DecodeFromBase64(String8 const& text);
/// Decodes onto @p out in slices; ends as the encoder does.
KERNEL_API void DecodeFromBase64(OutStream& out, char const* from, int count);

/// Encodes what is written to it onto another stream. The tail with its padding goes out when this stream is
/// destroyed, because padding may stand only at the end.
class KERNEL_API Base64OutStream final : public GatheringOutStream
{
public:
    static constexpr u32 c_rawBlockSize = 12288; ///< Bytes gathered before encoding; a multiple of 3.

    /// Keeps a reference to @p target. Throws std::bad_alloc without memory for its block.
    explicit Base64OutStream(Counted<OutStream> target);

private:
    ~Base64OutStream() override;
    bool Encode(OutStream& target, char const* from, u32 count) override { return FlushBase64(target, from, count); }
    bool FlushBase64(OutStream& target, char const* from, u32 count);
};

} // namespace Kernel
