#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/Exception.h"
#include "libkernel/streams/CompressionPredictor.h"
#include "libkernel/streams/InStream.h"

namespace Kernel {

/// Decompresses what it reads from another stream, and undoes predictor and striping.
///
/// It knows neither its size nor its end: EOS is true at every moment, size and position are 0, and a reader has to
/// know how much to ask for. It may take up to 256 KiB from the source beyond what the caller got.
///
/// Damage, or a source that gives nothing before its end, is a DecompressException if the stream was made so, and
/// otherwise a short read. The mere end of the data is a short read either way; where it comes too early, zlib finds it
/// damaged and Zstandard does not. After damage nothing more is read, and the call that meets it may give fewer bytes
/// than were good.
class KERNEL_API CompressionInStream : public InStream
{
public:
    class KERNEL_API DecompressException : public Exception
    {
    public:
        ~DecompressException() override;
    };

    /// The most bytes that a skip decompresses at a time where no chunk holds them.
    static constexpr u64 SCRATCH_SIZE = 1024;

    /// Gives the bytes delivered. With a predictor and no striping each call is decoded by itself, so it must ask for
    /// whole elements: bytes at the end that fill none come back undecoded. With striping any sizes do.
    u64 ReadBlock(void* to, u64 count) override;
    /// Decompresses and drops. False if the data ends before.
    bool SkipBlock(u64 count) override;
    /// Always true.
    bool EOS() const override;
    /// True if the decompressor has run out of memory, so that the short read or the exception says nothing about the
    /// data. The stream is of no further use then.
    bool LacksMemory() const { return m_lacksMemory; }
    /// Always 0, the position too.
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override;

protected:
    CompressionInStream(Counted<InStream> source, CompressionPredictorType type,
                        CompressionPredictorStripingType striping, bool throwOnError);
    ~CompressionInStream() override;

    /// Takes the blocks. False without memory or without a source.
    bool InitBlocks();
    /// Compressed bytes that were read from the source and not used yet.
    u8 const* GetInput() const { return m_inputRead; }
    u64 GetInputLeft() const { return m_inputLeft; }
    void UseInput(u64 count)
    {
        m_inputRead += count;
        m_inputLeft -= count;
    }

    /// Decompresses from the input to @p to, @p count bytes at most, and says in @p delivered how many came. There may
    /// be no input; what the decompressor still holds is then to be given. False for damaged data, and where there is
    /// no memory, after a SetLacksMemory().
    virtual bool DecompressFromBuffer(void* to, u64 count, u64& delivered) = 0;
    void SetLacksMemory() { m_lacksMemory = true; }

private:
    u64 Decompress(u8* to, u64 count, bool& failed);
    u64 ReadPlain(u8* to, u64 count);
    u64 ReadStriped(u8* to, u64 count);
    bool RefillChunks();

    Counted<InStream> m_source;
    Counted<CompressionPredictor> m_predictor; // Null without one.
    bool m_striped;
    bool const m_throwOnError;
    bool m_damaged = false; // The decompressor has refused the data.
    bool m_lacksMemory = false;
    u8* m_block = nullptr; // Input block; then, with striping, chunks and scratch.
    u8* m_inputRead = nullptr;
    u64 m_inputLeft = 0;
    u8* m_chunkRead = nullptr; // Decompressed, still striped and encoded.
    u64 m_chunkLeft = 0;
    u8* m_readyRead = nullptr; // Fully decoded, for the caller.
    u64 m_readyLeft = 0;
};

} // namespace Kernel
