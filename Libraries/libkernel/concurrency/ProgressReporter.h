#pragma once

#include "libkernel/concurrency/Progress.h"

#include <initializer_list>
#include <vector>

namespace Kernel {

/// The working half of progress: code that does the work sets numbers on it, and the attached Progress, if there is
/// one, is told. Setters may be called from any thread; each gives back its own lock before it calls back.
class KERNEL_API ProgressReporter : public Countable
{
public:
    ProgressReporter();
    /// From 0.0 to 1.0.
    virtual double GetProgress() const = 0;

    /// Tells the attached Progress that something changed.
    void OnUpdate();

protected:
    ~ProgressReporter() override;

private:
    friend class Progress;
    void Attach(Progress* progress);
    void Detach(Progress const* progress);

    mutable CriticalSectionSpin m_guard; // Held during the call back, so that the Progress can't go meanwhile.
    Progress* m_progress = nullptr;      // Not counted; guarded by m_guard.
};

/// One fraction, from 0.0 at the start.
class KERNEL_API BasicProgressReporter : public ProgressReporter
{
public:
    BasicProgressReporter();
    /// Values beyond 0.0 and 1.0 are cut to them. Both always call back.
    void SetProgress(double progress);
    void AddProgress(double progress);
    double GetProgress() const override;

protected:
    ~BasicProgressReporter() override;

private:
    mutable CriticalSectionSpin m_valueLock;
    double m_value = 0.0;
};

/// Steps done of a known number, with a fraction of the step that is under way.
class KERNEL_API CounterProgressReporter : public ProgressReporter
{
public:
    explicit CounterProgressReporter(u64 total = 0);

    /// Starts anew with another total. Calls back only if steps had been counted.
    void Init(u64 total);
    void Increment();
    void Set(u64 count);
    /// All steps done.
    void Finalise();
    /// Fraction of the step under way, kept as given and cut to 0.0 to 1.0 where it is read. Calls back only if it
    /// differs and steps are left.
    void SetSubProgress(double progress);

    u64 GetCount() const;
    u64 GetTotal() const;
    double GetSubProgress() const;
    /// 0.0 for a total of 0.
    double GetProgress() const override;

protected:
    ~CounterProgressReporter() override;

private:
    void SetCount(u64 count);

    mutable CriticalSectionSpin m_valueLock;
    u64 m_total;
    u64 m_count = 0;
    double m_subProgress = 0.0;
};

/// Owns weighted children, each of which can carry a reporter of its own. A change below passes up the tree.
class KERNEL_API MultiProgressReporter : public ProgressReporter
{
public:
    /// Adds a child behind the others; the form without a weight has weight 1.0. The child may outlive this object; it
    /// then passes nothing on.
    Counted<Progress> AddItem(String8 const& description);
    Counted<Progress> AddItem(String8 const& description, Counted<ProgressReporter> const& reporter);
    Counted<Progress> AddItem(double weight);

protected:
    class KERNEL_API SubProgress : public Progress
    {
    public:
        SubProgress(MultiProgressReporter* parent, double weight, String8 const& description);
        double GetWeight() const { return m_weight; }
        void OnProgressUpdate() override;

    protected:
        ~SubProgress() override;

    private:
        friend class MultiProgressReporter;
        void ForgetParent();

        CriticalSectionSpin m_parentLock;
        MultiProgressReporter* m_parent; // Not counted; null once the parent has gone. Guarded by m_parentLock.
        double const m_weight;
    };

    MultiProgressReporter();
    /// One child without a description for each weight.
    explicit MultiProgressReporter(std::vector<float> const& weights);
    explicit MultiProgressReporter(std::initializer_list<float> const& weights);
    ~MultiProgressReporter() override;

    Counted<SubProgress> AddItemI(double weight, String8 const& description);
    // The first @p complete children count in full.
    double GetWeightedMeanCS(u64 complete) const;

    mutable CriticalSectionSpin m_valueLock; // Guards m_items and what derived classes add.
    std::vector<Counted<SubProgress>> m_items;
};

/// Children that advance side by side: the weighted mean. Empty gives 0.0, weights that sum to zero 1.0.
class KERNEL_API ParallelProgressReporter : public MultiProgressReporter
{
public:
    ParallelProgressReporter();
    explicit ParallelProgressReporter(std::vector<float> const& weights);
    explicit ParallelProgressReporter(std::initializer_list<float> const& weights);
    double GetProgress() const override;

protected:
    ~ParallelProgressReporter() override;
};

/// Children that come one behind the other: those before the current one count in full.
class KERNEL_API SequenceProgressReporter : public MultiProgressReporter
{
public:
    SequenceProgressReporter();
    /// @p n children of weight 1.0.
    explicit SequenceProgressReporter(u64 n);
    explicit SequenceProgressReporter(std::vector<float> const& weights);
    explicit SequenceProgressReporter(std::initializer_list<float> const& weights);

    /// Makes a child current, found by itself or by its attached reporter. False, and nothing changes, for null or one
    /// that isn't there.
    bool BeginItem(NonCounted<Progress const> item);
    bool BeginItemWithReporter(NonCounted<ProgressReporter const> reporter);
    /// An index past the end makes the end current and gives null.
    Counted<Progress> BeginItemAtIndex(u64 index);
    /// Goes on to the next child; null past the end.
    Counted<Progress> ItemComplete();
    /// The current index must be within the list.
    Counted<Progress> GetCurrentItem() const;
    u64 GetCurrentItemIndex() const;
    double GetProgress() const override;

protected:
    ~SequenceProgressReporter() override;

private:
    template <class Match>
    bool BeginFirst(Match&& match);

    u64 m_current = 0; // Guarded by m_valueLock. May lie past the list's end.
};

} // namespace Kernel
