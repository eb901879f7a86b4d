#include "libkernel/concurrency/ProgressReporter.h"

#include "support/Rows.h"

#include <atomic>
#include <cmath>
#include <gtest/gtest.h>
#include <limits>
#include <thread>

namespace {

using namespace Kernel;

// Counts call backs and reads itself in each, as a host does.
class Shown : public Progress
{
public:
    explicit Shown(Counted<ProgressReporter> const& reporter = nullptr) : Progress("work", reporter) {}

    void OnProgressUpdate() override
    {
        ++calls;
        last = GetProgress();
    }

    std::atomic<int> calls{0};
    std::atomic<double> last{-1.0};

protected:
    ~Shown() override { SetReporter(nullptr); }
};

TEST(Progress, ShowsItsReporterUntilItIsComplete)
{
    auto const shown = MakeCounted<Shown>();
    EXPECT_EQ(0.0, shown->GetProgress());
    shown->SetAsIndeterminate();
    EXPECT_TRUE(shown->IsIndeterminate());
    EXPECT_EQ(0, shown->calls);

    auto const reporter = MakeCounted<BasicProgressReporter>();
    shown->SetReporter(reporter);
    EXPECT_FALSE(shown->IsIndeterminate());
    EXPECT_TRUE(shown->HasReporter(reporter));
    reporter->SetProgress(0.25);
    EXPECT_EQ(0.25, shown->last);
    shown->SetAsComplete();
    EXPECT_EQ(2, shown->calls);
    EXPECT_EQ(1.0, shown->last);

    shown->SetReporter(nullptr);
    EXPECT_FALSE(shown->HasReporter(reporter));
    reporter->SetProgress(0.5);
    EXPECT_EQ(2, shown->calls) << "a detached reporter still calls";
    EXPECT_EQ("work", shown->GetDescription());
}

TEST(BasicProgressReporter, ValuesAreCutAndEachCallTells)
{
    auto const reporter = MakeCounted<BasicProgressReporter>();
    auto const shown = MakeCounted<Shown>(reporter);
    int calls = 0;
    for (auto const& [add, value, result] : Rows<bool, double, double>{{false, 0.5, 0.5},
                                                                       {false, 0.5, 0.5},
                                                                       {true, 0.25, 0.75},
                                                                       {true, 5.0, 1.0},
                                                                       {true, -2.0, 0.0},
                                                                       {false, -1.0, 0.0},
                                                                       {false, 9.0, 1.0}})
    {
        add ? reporter->AddProgress(value) : reporter->SetProgress(value);
        EXPECT_EQ(result, reporter->GetProgress());
        EXPECT_EQ(++calls, shown->calls);
    }
}

TEST(CounterProgressReporter, FractionFollowsCountAndSubProgressAndOnlyRealChangesTell)
{
    auto const counter = MakeCounted<CounterProgressReporter>();
    counter->Finalise();
    EXPECT_EQ(0.0, counter->GetProgress()) << "the end of nothing";
    auto const shown = MakeCounted<Shown>(counter);
    Rows<char const*, std::function<void()>, double, int> const steps = {
        {"init without a count", [&] { counter->Init(10); }, 0.0, 0},
        {"sub-progress unchanged", [&] { counter->SetSubProgress(0.0); }, 0.0, 0},
        {"set", [&] { counter->Set(3); }, 0.3, 1},
        {"set to the same count", [&] { counter->Set(3); }, 0.3, 2},
        {"sub-progress", [&] { counter->SetSubProgress(0.5); }, 0.35, 3},
        {"the same again", [&] { counter->SetSubProgress(0.5); }, 0.35, 3},
        {"more than a step", [&] { counter->SetSubProgress(7.0); }, 0.4, 4},
        {"increment", [&] { counter->Increment(); }, 0.4, 5},
        {"finalise", [&] { counter->Finalise(); }, 1.0, 6},
        {"sub-progress behind the end", [&] { counter->SetSubProgress(0.7); }, 1.0, 6},
        {"past the end", [&] { counter->Increment(); }, 1.0, 7},
        {"far past it", [&] { counter->Set(~u64{0}); }, 1.0, 8},
        {"init with a count", [&] { counter->Init(4); }, 0.0, 9},
    };
    for (auto const& [what, act, progress, calls] : steps) {
        act();
        EXPECT_DOUBLE_EQ(progress, counter->GetProgress()) << what;
        EXPECT_EQ(calls, shown->calls) << what;
    }
    EXPECT_EQ(0u, counter->GetCount());
    EXPECT_EQ(0.0, counter->GetSubProgress());
}

TEST(ParallelProgressReporter, GivesTheWeightedMean)
{
    EXPECT_EQ(0.0, MakeCounted<ParallelProgressReporter>()->GetProgress());
    EXPECT_EQ(1.0, MakeCounted<ParallelProgressReporter>(std::vector<float>{0.0f, 0.0f})->GetProgress());
    auto const reporter = MakeCounted<ParallelProgressReporter>();
    auto const one = reporter->AddItem(1.0);
    auto const three = reporter->AddItem(3.0);
    one->SetAsComplete();
    EXPECT_EQ(0.25, reporter->GetProgress());
    auto const work = MakeCounted<BasicProgressReporter>();
    three->SetReporter(work);
    work->SetProgress(0.5);
    EXPECT_EQ(0.625, reporter->GetProgress());
}

TEST(ParallelProgressReporter, ChangesPassUpTheTreeWhileItStands)
{
    auto root = MakeCounted<ParallelProgressReporter>();
    auto shown = MakeCounted<Shown>(root);
    auto const branch = MakeCounted<SequenceProgressReporter>(2);
    auto const leaf = MakeCounted<BasicProgressReporter>();
    root->AddItem("left", branch);
    auto const right = root->AddItem("right");
    branch->BeginItemAtIndex(1)->SetReporter(leaf);
    int const before = shown->calls;
    leaf->SetProgress(0.5);
    EXPECT_EQ(before + 1, shown->calls);
    EXPECT_EQ(0.375, shown->last);
    shown.Reset(); // Leaves and children outlive what they told.
    root.Reset();
    leaf->SetProgress(0.75);
    right->SetAsComplete();
    EXPECT_EQ(1.0, right->GetProgress());
}

TEST(SequenceProgressReporter, ItemsBeforeTheCurrentOneCountInFull)
{
    auto const sequence = MakeCounted<SequenceProgressReporter>(2);
    auto const shown = MakeCounted<Shown>(sequence);
    EXPECT_EQ(0.0, sequence->GetProgress());
    EXPECT_TRUE(sequence->ItemComplete());
    EXPECT_EQ(0.5, sequence->GetProgress());
    EXPECT_FALSE(sequence->ItemComplete());
    EXPECT_EQ(1.0, sequence->GetProgress());
    EXPECT_EQ(2, shown->calls);
    Counted<SequenceProgressReporter> const weighted(new SequenceProgressReporter{1.0f, 2.0f, 1.0f});
    auto const work = MakeCounted<BasicProgressReporter>();
    weighted->BeginItemAtIndex(2)->SetReporter(work);
    work->SetProgress(0.5);
    EXPECT_EQ(0.875, weighted->GetProgress());
    weighted->BeginItemAtIndex(0);
    EXPECT_EQ(0.125, weighted->GetProgress()) << "a later item counts its own progress";
    EXPECT_EQ(0.0, MakeCounted<SequenceProgressReporter>()->GetProgress());
    EXPECT_EQ(1.0, MakeCounted<SequenceProgressReporter>(std::vector<float>{0.0f})->GetProgress());
}

TEST(SequenceProgressReporter, UnknownItemsChangeNothing)
{
    auto const sequence = MakeCounted<SequenceProgressReporter>();
    auto const work = MakeCounted<BasicProgressReporter>();
    auto const first = sequence->AddItem("first");
    auto const second = sequence->AddItem("second", work);
    auto const shown = MakeCounted<Shown>(sequence);
    EXPECT_FALSE(sequence->BeginItem(nullptr));
    EXPECT_FALSE(sequence->BeginItem(Counted<Progress>(shown)));
    EXPECT_FALSE(sequence->BeginItemWithReporter(nullptr)) << "the first child has no reporter either";
    EXPECT_FALSE(sequence->BeginItemWithReporter(sequence));
    EXPECT_EQ(0, shown->calls);
    EXPECT_EQ(0u, sequence->GetCurrentItemIndex());
    EXPECT_TRUE(sequence->BeginItemWithReporter(work));
    EXPECT_EQ(second, sequence->GetCurrentItem());
    EXPECT_TRUE(sequence->BeginItem(first));
    EXPECT_EQ(2, shown->calls);
    EXPECT_FALSE(sequence->BeginItemAtIndex(99));
    EXPECT_EQ(2u, sequence->GetCurrentItemIndex());
    EXPECT_EQ(3, shown->calls);
}

// Setters, readers and a host that attaches and detaches, all at once: no deadlock, no race, nothing called that is
// gone.
TEST(ProgressReporter, ThreadsMayReportReadAndAttachTogether)
{
    auto const root = MakeCounted<ParallelProgressReporter>();
    auto const shown = MakeCounted<Shown>(root);
    auto const branch = MakeCounted<SequenceProgressReporter>(u64{4});
    auto const leaf = MakeCounted<CounterProgressReporter>(1000);
    root->AddItem("branch", branch);
    auto const child = branch->BeginItemAtIndex(0);
    child->SetReporter(leaf);
    std::atomic<bool> stop{false};
    std::thread reader([&] {
        while (!stop) {
            double const progress = shown->GetProgress();
            EXPECT_TRUE(progress >= 0.0 && progress <= 1.0);
        }
    });
    std::thread attacher([&] {
        for (int i = 0; i < 500; ++i) {
            child->SetReporter(i % 2 ? leaf : nullptr);
            shown->SetReporter(i % 3 ? root : nullptr);
            auto const passing = MakeCounted<ParallelProgressReporter>();
            passing->AddItem("passing", leaf); // The leaf's other owner comes and goes.
        }
    });
    for (int i = 0; i < 2000; ++i) i % 2 ? leaf->Increment() : leaf->SetSubProgress(i);
    attacher.join();
    stop = true;
    reader.join();
}

} // namespace
