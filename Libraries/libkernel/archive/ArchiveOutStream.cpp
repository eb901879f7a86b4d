#include "libkernel/archive/internal/ArchiveSessionState.h"
#include "libkernel/streams/CRC32.h"

namespace Kernel {

using namespace ArchiveFormat;

/// Where the compressor's output goes: takes the CRC of the stored bytes and appends them.
class ArchiveOutStream::Sink : public OutStream
{
public:
    explicit Sink(ArchiveAppender& appender) : m_appender(appender) { CRC32::BeginCRC32(m_crc); }

    u64 WriteBlock(void const* from, u64 count) override
    {
        CRC32::CalcCRC32(from, count, m_crc);
        m_appender.Append(from, count);
        m_size += count;
        return count;
    }
    u64 GetSizeOutStream() const override { return m_size; }
    u64 TellOutStream() const override { return m_size; }

    u32 GetCRC() const
    {
        u32 crc = m_crc;
        CRC32::EndCRC32(crc);
        return crc;
    }

private:
    ~Sink() override = default;

    ArchiveAppender& m_appender;
    u32 m_crc;
    u64 m_size = 0;
};

ArchiveOutStream::ArchiveOutStream(ArchiveAppender& appender, FileStoreCompressionHint const* hint)
    : m_appender(appender)
{
    CRC32::BeginCRC32(m_crc);
    auto const* const general = dynamic_cast<FileStoreCompressionHintGeneral const*>(hint);
    if (!general) return;
    CompressionPredictorType const type = general->GetCompressionPredictorType();
    CompressionPredictorStripingType const striping = general->GetCompressionPredictorStripingType();
    int level = 0;
    switch (general->GetCompressionLevel()) {
    case FileStoreCompressionHintGeneral::CompressionLevelDefault: level = ZStandardOutStream::c_defaultLevel; break;
    case FileStoreCompressionHintGeneral::CompressionLevelMin: level = ZStandardOutStream::MinCompression(); break;
    case FileStoreCompressionHintGeneral::CompressionLevelMax: level = ZStandardOutStream::MaxCompression(); break;
    default: return;
    }
    m_sink = MakeCounted<Sink>(appender);
    m_compressor = ZStandardOutStream::Create(m_sink, type, striping, level);
    if (!m_compressor) throw OutStream::WriteException();
}

ArchiveOutStream::~ArchiveOutStream() = default;

u64 ArchiveOutStream::WriteBlock(void const* from, u64 count)
{
    if (m_failed) return 0;
    CRC32::CalcCRC32(from, count, m_crc);
    if (!m_compressor) {
        m_appender.Append(from, count);
    } else if (count != 0 && m_compressor->WriteBlock(from, count) != count) {
        m_failed = true;
        return 0;
    }
    m_size += count;
    return count;
}

void ArchiveOutStream::Finish()
{
    // A compressor that failed earlier answers true here: its state tells.
    if (m_compressor)
        m_failed =
            !m_compressor->Finalise() || m_failed || m_compressor->GetState() != CompressionOutStream::State::Finalised;
    if (m_failed) throw OutStream::WriteException();
    CRC32::EndCRC32(m_crc);
}

u32 ArchiveOutStream::GetStoredCRC() const
{
    return m_sink ? m_sink->GetCRC() : m_crc;
}

u8 ArchiveOutStream::GetCompressionCode() const
{
    if (!m_compressor) return MakeCode(MethodDirect, 0, 0);
    return MakeCode(MethodZStandard, static_cast<int>(m_compressor->GetCompressionPredictorType()),
                    static_cast<int>(m_compressor->GetCompressionPredictorStripingType()));
}

} // namespace Kernel
