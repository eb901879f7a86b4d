#pragma once

#include "libkernel/streams/GatheringOutStream.h"

namespace Kernel {

// ASCII85 as the page description languages have it, without the <~ ~> frame: four bytes, taken big-endian, give five
// digits from '!' up, most significant first; four zero bytes give the one character 'z'. A tail of 1, 2 or 3 bytes is
// filled up with zeros and gives its first 2, 3 or 4 digits. Nothing closes the text.
//
// Each group is kept whole: a line ends behind the group that brings the column to 75 or more.

/// What ends a line.
enum Base85LineMode : int
{
    Base85LineModeNone = 0,
    Base85LineModeLF = 1,
    Base85LineModeCRLF = 2
};

/// Encodes @p count bytes and gives the characters written, line ends included, no terminator. @p column is the place
/// in the line, 0 to begin with; it is carried from call to call. 0, with @p column as it was, if the text does not
/// fit in @p size characters or @p count is not positive. Only the last piece of a text may have a tail.
KERNEL_API int EncodeToBase85(char* to, int size, char const* from, int count, int& column, int lineMode);
/// Encodes a whole text onto @p out in slices. Ends at the first slice that @p out does not take whole; how far it
/// came shows in the stream's own position.
KERNEL_API void EncodeToBase85(OutStream& out, char const* from, int count, int lineMode);

/// Encodes what is written to it onto another stream. The tail goes out when this stream is destroyed.
class KERNEL_API Base85OutStream final : public GatheringOutStream
{
public:
    static constexpr u32 c_rawBlockSize = 12000; ///< Bytes gathered before encoding; a multiple of 4.

    /// Keeps a reference to @p target. Throws std::bad_alloc without memory for its block.
    Base85OutStream(Counted<OutStream> target, int lineMode);

private:
    ~Base85OutStream() override;
    bool Encode(OutStream& target, char const* from, u32 count) override { return FlushBase85(target, from, count); }
    bool FlushBase85(OutStream& target, char const* from, u32 count);

    int const m_lineMode;
    int m_column = 0;
};

} // namespace Kernel
