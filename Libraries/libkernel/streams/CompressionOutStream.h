#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/streams/CompressionPredictor.h"
#include "libkernel/streams/OutStream.h"

namespace Kernel {

/// Compresses what is written to it into another stream, after a predictor and striping where those are asked for.
///
/// The caller ends it with Finalise: a stream that is destroyed before leaves an unterminated compressed stream in its
/// target. Failures are results: once the target or the compressor has failed every write gives 0. An exception from
/// the target passes through and leaves the stream failed.
///
/// With a predictor the bytes are worked on in blocks of 128 KiB from the start of the stream. Striping moves whole
/// chunks of 64 KiB, so only the last, partial chunk of a stream stays unstriped. Working blocks and the compressor's
/// contexts are kept for the next stream, so that making many short-lived ones is cheap.
class KERNEL_API CompressionOutStream : public OutStream
{
public:
    enum class State : u32
    {
        Open = 0,
        Failed = 1, ///< Or aborted.
        Finalised = 2
    };

    /// Bytes in the compressor's output block and in the predictor's working block.
    static u64 GetBufferSize();

    /// Gives @p count, or 0 if the stream is not open, @p count is 0 or something fails.
    u64 WriteBlock(void const* from, u64 count) override;
    /// True, and does nothing: only Finalise brings everything out.
    bool Flush() override;
    /// The compressed bytes that the target has taken so far; the position is the same.
    u64 GetSizeOutStream() const override;
    u64 TellOutStream() const override;

    /// Writes what is held and the compressed stream's end. True if that worked, or if the stream was not open any
    /// more, when nothing is done.
    bool Finalise();
    /// Gives up: the target stays as it is, and nothing more is written to it.
    void Abort();

    State GetState() const { return m_state; }
    /// None where the stream was made with a number that is no type.
    CompressionPredictorType GetCompressionPredictorType() const { return m_type; }
    /// Always None without a predictor.
    CompressionPredictorStripingType GetCompressionPredictorStripingType() const { return m_striping; }

protected:
    CompressionOutStream(Counted<OutStream> target, CompressionPredictorType type,
                         CompressionPredictorStripingType striping);
    ~CompressionOutStream() override;

    /// Takes the working block. False without memory or without a target.
    bool InitBlock();
    /// The compressor's output block, GetBufferSize() bytes.
    u8* GetOutputBlock() const { return m_block; }
    /// Hands compressed bytes to the target. False if it takes fewer.
    bool WriteToTarget(void const* from, u64 count);

    /// Compresses @p count bytes; false on failure.
    virtual bool WriteToCompressionStream(void const* from, u64 count) = 0;
    /// Ends the compressed stream; false on failure.
    virtual bool FinaliseCompressionStream() = 0;

private:
    bool DoPredictor();
    bool CompressBlock(u8 const* from, u64 count);
    bool Compress(void const* from, u64 count);

    Counted<OutStream> m_target;
    State m_state = State::Open;
    Counted<CompressionPredictor> m_predictor; // Null without one.
    CompressionPredictorType m_type;
    CompressionPredictorStripingType m_striping;
    u8* m_block = nullptr; // Output block; then, with a predictor, working block; then, with striping, scratch.
    u64 m_fill = 0;        // Bytes gathered in the working block.
    u64 m_compressedBytes = 0;
};

} // namespace Kernel
