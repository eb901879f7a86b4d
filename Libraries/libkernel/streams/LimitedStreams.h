#pragma once

#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

namespace Kernel {

/// The next bytes of another stream, up to a limit, as a stream of their own: position 0 is where the source stood.
class KERNEL_API LimitedInStream final : public InStream
{
public:
    /// Keeps @p source; nobody else should move it meanwhile. Null without a source.
    static Counted<LimitedInStream> Create(Counted<InStream> const& source, u64 limit);

    u64 ReadBlock(void* to, u64 count) override;
    /// Cuts @p count to what the limit leaves; the rest is the source's answer.
    bool SkipBlock(u64 count) override;
    bool EOS() const override;
    bool SlowProgressInStream() const override;
    u64 GetSizeInStream() const override;
    u64 TellInStream() const override { return m_consumed; }
    /// Bytes that the limit still allows; the source may end before.
    u64 Remaining() const { return m_limit - m_consumed; }

private:
    LimitedInStream(Counted<InStream> const& source, u64 limit);
    ~LimitedInStream() override;

    Counted<InStream> const m_source;
    u64 const m_start; // The source's position at creation.
    u64 const m_limit;
    u64 m_consumed = 0; // Never above m_limit.
};

/// Lets only so many bytes through to another stream.
class KERNEL_API LimitedOutStream final : public OutStream
{
public:
    /// Keeps @p target. Null without one.
    static Counted<LimitedOutStream> Create(Counted<OutStream> const& target, u64 limit);
    /// Borrows @p target, which must outlive the stream.
    static Counted<LimitedOutStream> Create(OutStream& target, u64 limit);

    /// Of more than is allowed it writes what is allowed, and remembers that it was asked for more.
    u64 WriteBlock(void const* from, u64 count) override;
    bool Flush() override;
    bool ForceFlush() override;
    bool SlowProgressOutStream() const override;
    /// Bytes passed on, as TellOutStream.
    u64 GetSizeOutStream() const override { return m_limit - m_allowed; }
    u64 TellOutStream() const override { return m_limit - m_allowed; }
    /// True once a write wanted more than was allowed.
    bool WasExceeded() const { return m_exceeded; }

private:
    LimitedOutStream(OutStream& target, Counted<OutStream> const& owner, u64 limit);
    ~LimitedOutStream() override;

    OutStream& m_target;
    Counted<OutStream> const m_owner; // Null where the target is only borrowed.
    u64 m_allowed;
    u64 const m_limit;
    bool m_exceeded = false;
};

} // namespace Kernel
