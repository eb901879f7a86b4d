#include "libkernel/concurrency/ProgressReporter.h"

#include <algorithm>
#include <cassert>
#include <utility>

namespace Kernel {
namespace {

double Clamp(double value)
{
    return std::clamp(value, 0.0, 1.0);
}

} // namespace

ProgressReporter::ProgressReporter() = default;
ProgressReporter::~ProgressReporter() = default;

void ProgressReporter::OnUpdate()
{
    CriticalSectionSpinScope const lock(m_guard);
    if (m_progress) m_progress->OnProgressUpdate();
}

void ProgressReporter::Attach(Progress* progress)
{
    CriticalSectionSpinScope const lock(m_guard);
    m_progress = progress;
}

void ProgressReporter::Detach(Progress const* progress)
{
    CriticalSectionSpinScope const lock(m_guard);
    if (m_progress == progress) m_progress = nullptr;
}

BasicProgressReporter::BasicProgressReporter() = default;
BasicProgressReporter::~BasicProgressReporter() = default;

void BasicProgressReporter::SetProgress(double progress)
{
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        m_value = Clamp(progress);
    }
    OnUpdate();
}

void BasicProgressReporter::AddProgress(double progress)
{
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        m_value = Clamp(m_value + progress);
    }
    OnUpdate();
}

double BasicProgressReporter::GetProgress() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    return m_value;
}

CounterProgressReporter::CounterProgressReporter(u64 total) : m_total(total) {}
CounterProgressReporter::~CounterProgressReporter() = default;

void CounterProgressReporter::Init(u64 total)
{
    bool hadCount = false;
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        hadCount = m_count != 0;
        m_total = total;
        m_count = 0;
        m_subProgress = 0.0;
    }
    if (hadCount) OnUpdate();
}

void CounterProgressReporter::Increment()
{
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        ++m_count;
        m_subProgress = 0.0;
    }
    OnUpdate();
}

void CounterProgressReporter::Set(u64 count)
{
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        m_count = count;
        m_subProgress = 0.0;
    }
    OnUpdate();
}

void CounterProgressReporter::Finalise()
{
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        m_count = m_total;
        m_subProgress = 0.0;
    }
    OnUpdate();
}

void CounterProgressReporter::SetSubProgress(double progress)
{
    bool tell = false;
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        tell = m_count < m_total && m_subProgress != progress;
        m_subProgress = progress;
    }
    if (tell) OnUpdate();
}

u64 CounterProgressReporter::GetCount() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    return m_count;
}

u64 CounterProgressReporter::GetTotal() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    return m_total;
}

double CounterProgressReporter::GetSubProgress() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    return m_subProgress;
}

double CounterProgressReporter::GetProgress() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    if (m_total == 0) return 0.0;
    if (m_count >= m_total) return 1.0;
    return (static_cast<double>(m_count) + Clamp(m_subProgress)) / static_cast<double>(m_total);
}

MultiProgressReporter::SubProgress::SubProgress(MultiProgressReporter* parent, double weight,
                                                String8 const& description)
    : Progress(description), m_parent(parent), m_weight(weight)
{
}

MultiProgressReporter::SubProgress::~SubProgress()
{
    SetReporter(nullptr);
}

// The lock keeps the parent from going while it is told.
void MultiProgressReporter::SubProgress::OnProgressUpdate()
{
    CriticalSectionSpinScope const lock(m_parentLock);
    if (m_parent) m_parent->OnUpdate();
}

void MultiProgressReporter::SubProgress::ForgetParent()
{
    CriticalSectionSpinScope const lock(m_parentLock);
    m_parent = nullptr;
}

MultiProgressReporter::MultiProgressReporter() = default;

MultiProgressReporter::MultiProgressReporter(std::vector<float> const& weights)
{
    for (float const weight : weights) AddItemI(weight, String8());
}

MultiProgressReporter::MultiProgressReporter(std::initializer_list<float> const& weights)
{
    for (float const weight : weights) AddItemI(weight, String8());
}

// The list is taken out first: a child's parent lock must not be waited for under the value lock, because a call back
// that holds the former may read progress.
MultiProgressReporter::~MultiProgressReporter()
{
    std::vector<Counted<SubProgress>> items;
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        items.swap(m_items);
    }
    for (auto const& item : items) item->ForgetParent();
}

Counted<MultiProgressReporter::SubProgress> MultiProgressReporter::AddItemI(double weight, String8 const& description)
{
    Counted<SubProgress> item = MakeCounted<SubProgress>(this, weight, description);
    CriticalSectionSpinScope const lock(m_valueLock);
    m_items.push_back(item);
    return item;
}

Counted<Progress> MultiProgressReporter::AddItem(String8 const& description)
{
    return AddItemI(1.0, description);
}

Counted<Progress> MultiProgressReporter::AddItem(String8 const& description, Counted<ProgressReporter> const& reporter)
{
    Counted<SubProgress> item = MakeCounted<SubProgress>(this, 1.0, description);
    item->SetReporter(reporter);
    CriticalSectionSpinScope const lock(m_valueLock);
    m_items.push_back(item);
    return item;
}

Counted<Progress> MultiProgressReporter::AddItem(double weight)
{
    return AddItemI(weight, String8());
}

ParallelProgressReporter::ParallelProgressReporter() = default;
ParallelProgressReporter::ParallelProgressReporter(std::vector<float> const& weights) : MultiProgressReporter(weights)
{
}
ParallelProgressReporter::ParallelProgressReporter(std::initializer_list<float> const& weights)
    : MultiProgressReporter(weights)
{
}
ParallelProgressReporter::~ParallelProgressReporter() = default;

double MultiProgressReporter::GetWeightedMeanCS(u64 complete) const
{
    if (m_items.empty()) return 0.0;
    double sum = 0.0;
    double weights = 0.0;
    for (u64 i = 0; i < m_items.size(); ++i) {
        double const weight = m_items[i]->GetWeight();
        sum += i < complete ? weight : weight * Clamp(m_items[i]->GetProgress());
        weights += weight;
    }
    return weights == 0.0 ? 1.0 : sum / weights;
}

double ParallelProgressReporter::GetProgress() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    return GetWeightedMeanCS(0);
}

SequenceProgressReporter::SequenceProgressReporter() = default;

SequenceProgressReporter::SequenceProgressReporter(u64 n)
{
    for (u64 i = 0; i < n; ++i) AddItemI(1.0, String8());
}

SequenceProgressReporter::SequenceProgressReporter(std::vector<float> const& weights) : MultiProgressReporter(weights)
{
}
SequenceProgressReporter::SequenceProgressReporter(std::initializer_list<float> const& weights)
    : MultiProgressReporter(weights)
{
}
SequenceProgressReporter::~SequenceProgressReporter() = default;

template <class Match>
bool SequenceProgressReporter::BeginFirst(Match&& match)
{
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        auto const found = std::find_if(m_items.begin(), m_items.end(), match);
        if (found == m_items.end()) return false;
        m_current = static_cast<u64>(found - m_items.begin());
    }
    OnUpdate();
    return true;
}

bool SequenceProgressReporter::BeginItem(NonCounted<Progress const> item)
{
    return item && BeginFirst([&](Counted<SubProgress> const& one) { return one.Get() == item.Get(); });
}

bool SequenceProgressReporter::BeginItemWithReporter(NonCounted<ProgressReporter const> reporter)
{
    return reporter && BeginFirst([&](Counted<SubProgress> const& one) { return one->HasReporter(reporter); });
}

Counted<Progress> SequenceProgressReporter::BeginItemAtIndex(u64 index)
{
    Counted<Progress> item;
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        m_current = std::min<u64>(index, m_items.size());
        if (m_current < m_items.size()) item = m_items[m_current];
    }
    OnUpdate();
    return item;
}

Counted<Progress> SequenceProgressReporter::ItemComplete()
{
    Counted<Progress> item;
    {
        CriticalSectionSpinScope const lock(m_valueLock);
        ++m_current;
        if (m_current < m_items.size()) item = m_items[m_current];
    }
    OnUpdate();
    return item;
}

Counted<Progress> SequenceProgressReporter::GetCurrentItem() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    assert(m_current < m_items.size());
    return m_current < m_items.size() ? Counted<Progress>(m_items[m_current]) : nullptr;
}

u64 SequenceProgressReporter::GetCurrentItemIndex() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    return m_current;
}

double SequenceProgressReporter::GetProgress() const
{
    CriticalSectionSpinScope const lock(m_valueLock);
    if (!m_items.empty() && m_current >= m_items.size()) return 1.0;
    return GetWeightedMeanCS(m_current);
}

} // namespace Kernel
