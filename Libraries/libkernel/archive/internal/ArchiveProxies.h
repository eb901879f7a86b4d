#pragma once

#include "libkernel/core/FragmentedRawData.h"
#include "libkernel/streams/InOutStream.h"

namespace Kernel {

/// Gives the compact writer a target that is only an OutStream. Cannot be read or moved about in. Borrows the stream.
class OutStreamProxy final : public InOutStreamSeekable
{
public:
    explicit OutStreamProxy(OutStream& out) : m_out(out) {}

    u64 ReadBlock(void*, u64) override { return 0; }
    u64 GetSizeInStream() const override { return m_out.GetSizeOutStream(); }
    u64 TellInStream() const override { return m_out.TellOutStream(); }
    bool SeekInStream(SeekMethod, i64) override { return false; }
    u64 WriteBlock(void const* from, u64 count) override { return m_out.WriteBlock(from, count); }
    bool Flush() override { return m_out.Flush(); }
    bool ForceFlush() override { return m_out.ForceFlush(); }
    u64 GetSizeOutStream() const override { return m_out.GetSizeOutStream(); }
    u64 TellOutStream() const override { return m_out.TellOutStream(); }
    bool Truncate(u64) override { return false; }
    bool SeekOutStream(SeekMethod, i64) override { return false; }

private:
    ~OutStreamProxy() override;

    OutStream& m_out;
};

/// The same for a block of data that a caller owns, which need not be a counted object. Writes grow it. Borrows it.
class DataOutStreamProxy final : public InOutStreamSeekable
{
public:
    explicit DataOutStreamProxy(FragmentedRawData& data) : m_data(data) {}

    u64 ReadBlock(void*, u64) override { return 0; }
    u64 GetSizeInStream() const override { return m_data.GetSize(); }
    u64 TellInStream() const override { return m_position; }
    bool SeekInStream(SeekMethod method, i64 offset) override;
    u64 WriteBlock(void const* from, u64 count) override;
    u64 GetSizeOutStream() const override { return m_data.GetSize(); }
    u64 TellOutStream() const override { return m_position; }
    bool Truncate(u64 size) override;
    bool SeekOutStream(SeekMethod method, i64 offset) override { return SeekInStream(method, offset); }

private:
    ~DataOutStreamProxy() override;

    FragmentedRawData& m_data;
    u64 m_position = 0;
};

} // namespace Kernel
