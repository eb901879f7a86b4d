#pragma once

#include "libkernel/streams/InOutStream.h"

namespace Kernel {

class FragmentedRawData;

/// Reads and writes a FragmentedRawData, with one position for both. The position starts at the end, so that writing
/// appends; a reader rewinds first.
class KERNEL_API FragmentedRawDataStream final : public InOutStreamSeekable
{
public:
    /// Keeps @p data, which may be changed by others between operations. Null without data.
    static Counted<FragmentedRawDataStream> Create(Counted<FragmentedRawData> const& data);

    u64 ReadBlock(void* to, u64 count) override;
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return m_position; }
    /// A target before the start is the start. One beyond the end lengthens the data, by bytes of no defined value;
    /// false if there is no memory for them.
    bool SeekInStream(SeekMethod method, i64 offset) override;

    /// Writes all or nothing.
    u64 WriteBlock(void const* from, u64 count) override;
    u64 GetSizeOutStream() const override;
    u64 TellOutStream() const override { return m_position; }
    bool Truncate(u64 size) override;
    bool SeekOutStream(SeekMethod method, i64 offset) override;

private:
    explicit FragmentedRawDataStream(Counted<FragmentedRawData> const& data);
    ~FragmentedRawDataStream() override;
    bool SeekI(SeekMethod method, i64 offset);

    Counted<FragmentedRawData> const m_data;
    u64 m_position;
};

} // namespace Kernel
