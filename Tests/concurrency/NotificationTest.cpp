#include "libkernel/concurrency/Notification.h"

#include <gtest/gtest.h>

namespace TestNames {

class DiskFull : public Kernel::Notification
{
};

} // namespace TestNames

namespace {

using namespace Kernel;

class Sink : public Reporter
{
public:
    using Reporter::Report;
    void Begin(Type) override {}
    void Report(Type type, String16 const& text) override { lastType = type, wide = text; }
    void Report(Type type, String8 const& text) override { lastType = type, narrow = text; }

    Type lastType{};
    String16 wide;
    String8 narrow;
};

TEST(Reporter, TextsArriveAsStrings)
{
    Sink sink;
    Reporter::Type const type{7};
    sink.Reporter::Report(type, "hello");
    EXPECT_EQ(type, sink.lastType);
    EXPECT_EQ("hello", sink.narrow);
    sink.Reporter::Report(type, "hello", 4);
    EXPECT_EQ("hell", sink.narrow);
    sink.Reporter::Report(type, "hello", 0);
    EXPECT_EQ("", sink.narrow);
    sink.Reporter::Report(type, "hello", 0xFFFFFFFFu);
    EXPECT_EQ("hello", sink.narrow) << "negative as 32 bits: up to the terminator";
    sink.Reporter::Report(type, L"w\u00e4\U0001F600");
    EXPECT_EQ(String16(u"w\u00e4\U0001F600"), sink.wide);
    sink.Reporter::Report(type, L"wide", 2);
    EXPECT_EQ(String16(u"wi"), sink.wide);
    sink.Reporter::Report(type, static_cast<wchar_t const*>(nullptr));
    EXPECT_TRUE(sink.wide.IsEmpty());
}

Counted<Notification> s_last;

TEST(Broadcaster, NotificationsGoToTheSink)
{
    Broadcaster broadcaster;
    Counted<Notification> const full(new TestNames::DiskFull);
    broadcaster.Notify(full); // No sink: dropped.
    broadcaster.SetNotificationSink([](Counted<Notification> n) { s_last = n; });
    broadcaster.Notify(full);
    EXPECT_EQ(full, s_last);
    EXPECT_EQ(0, full->GetDedupeId());
    EXPECT_EQ(full, full->Merge(Counted<Notification>(new TestNames::DiskFull)));
    EXPECT_EQ("DiskFull", full->GetDescription());
    s_last.Reset();
}

} // namespace
