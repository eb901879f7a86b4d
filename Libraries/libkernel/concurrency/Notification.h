#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/String.h"

namespace Kernel {

/// A message sink for hosts.
class KERNEL_API Reporter
{
public:
    /// The kinds of message are the host's.
    enum class Type : i32
    {
    };

    virtual ~Reporter();

    /// A length that is negative as a 32-bit integer means up to the terminator.
    virtual void Report(Type type, wchar_t const* text, u64 length);
    virtual void Report(Type type, char const* text, u64 length);
    virtual void Report(Type type, wchar_t const* text);
    virtual void Report(Type type, char const* text);

    /// Three slots of the interface that the library never calls.
    virtual void Begin(Type type) = 0;
    virtual void Report(Type type, String16 const& text) = 0;
    virtual void Report(Type type, String8 const& text) = 0;
};

/// Something that happened and that a host may want to show.
class KERNEL_API Notification : public virtual Countable
{
public:
    /// Notifications of one id that isn't 0 may be merged.
    virtual int GetDedupeId() const;
    /// What stands for both; here the receiver, the other is dropped.
    virtual Counted<Notification> Merge(Counted<Notification> other);

    /// The class's name, for display.
    String8 GetDescription() const;

protected:
    ~Notification() override;
};

/// Passes notifications to the host's sink.
class KERNEL_API Broadcaster
{
public:
    using Sink = void (*)(Counted<Notification>);

    virtual ~Broadcaster();
    /// Calls the sink, if there is one, on this thread.
    virtual void Notify(Counted<Notification> notification);

    Sink GetNotificationSink() const { return m_sink; }
    void SetNotificationSink(Sink sink) { m_sink = sink; }

private:
    Sink m_sink = nullptr;
};

} // namespace Kernel
