#include "support/CrashImages.h"

#include <algorithm>
#include <random>
#include <string_view>

namespace TestSupport {
namespace {

using namespace Kernel;
using Kind = MemoryDisk::Kind;
using Step = MemoryDisk::Step;
using Image = MemoryDisk::Image;
using Content = std::shared_ptr<std::string const>;

constexpr u64 c_allSubsets = 12;   // Up to so many pending changes, every subset is made.
constexpr u64 c_tornAnywhere = 64; // Bytes of a write that may stop at any byte.
constexpr u64 c_sector = 512;
constexpr u64 c_fixedPart = 512; // Small records below here are overwritten in place, so they are torn in every way.

// What happens to one pending change.
struct Fate
{
    bool kept = false;
    u64 begin = 0; // Of a kept write, the bytes that arrive.
    u64 end = ~u64{0};
    u64 mix = 0; // Not 0: the seed that chooses byte by byte.
};
using Fates = std::vector<Fate>;

// What lies on the device for sure, and what else may.
struct Device
{
    std::map<std::string, u64> names;
    std::map<u64, Content> contents;
    std::vector<Step const*> pending;
};

bool IsName(Step const& step)
{
    return step.kind == Kind::Create || step.kind == Kind::Rename || step.kind == Kind::Unlink;
}

std::string FolderOf(std::string const& path)
{
    return path.substr(0, path.rfind('/'));
}

void ApplyName(Step const& step, std::map<std::string, u64>& names)
{
    if (step.kind == Kind::Create) names[step.name] = step.file;
    if (step.kind == Kind::Unlink) names.erase(step.name);
    if (step.kind != Kind::Rename) return;
    auto const from = names.find(step.name);
    if (from == names.end() || from->second != step.file) return;
    names[step.to] = step.file;
    names.erase(step.name);
}

void ApplyData(Step const& step, Fate const& fate, std::string& content)
{
    if (step.kind == Kind::SetSize) {
        content.resize(step.offset, '\0');
        return;
    }
    u64 const begin = std::min<u64>(fate.begin, step.data.size());
    u64 const end = std::min<u64>(fate.end, step.data.size());
    if (begin >= end) return;
    if (content.size() < step.offset + end) content.resize(step.offset + end, '\0');
    if (fate.mix == 0) {
        content.replace(step.offset + begin, end - begin, step.data, begin, end - begin);
        return;
    }
    std::mt19937_64 random(fate.mix);
    for (u64 i = begin; i < end; ++i)
        if (random() % 2) content[step.offset + i] = step.data[i];
}

// Folds in the pending changes that a flush makes safe.
template <class Match>
void Settle(Device& device, Match&& match)
{
    std::map<u64, std::string> changed;
    std::vector<Step const*> left;
    for (Step const* one : device.pending) {
        if (!match(*one)) {
            left.push_back(one);
        } else if (IsName(*one)) {
            ApplyName(*one, device.names);
        } else {
            auto const [to, fresh] = changed.try_emplace(one->file);
            if (Content const& old = device.contents[one->file]; fresh && old) to->second = *old;
            ApplyData(*one, {.kept = true}, to->second);
        }
    }
    for (auto& [file, content] : changed)
        device.contents[file] = std::make_shared<std::string const>(std::move(content));
    device.pending = std::move(left);
}

void Advance(Device& device, Step const& step)
{
    if (step.kind == Kind::Flush)
        Settle(device, [&](Step const& one) { return !IsName(one) && one.file == step.file; });
    else if (step.kind == Kind::FlushFolder)
        Settle(device, [&](Step const& one) {
            return IsName(one) && FolderOf(one.to.empty() ? one.name : one.to) == step.name;
        });
    else
        device.pending.push_back(&step);
}

Image MakeImage(Device const& device, Fates const& fates)
{
    std::map<std::string, u64> names = device.names;
    std::map<u64, std::string> changed;
    for (u64 i = 0; i < fates.size(); ++i) {
        if (!fates[i].kept) continue;
        Step const& step = *device.pending[i];
        if (IsName(step)) {
            ApplyName(step, names);
            continue;
        }
        auto const [to, fresh] = changed.try_emplace(step.file);
        if (auto const old = device.contents.find(step.file); fresh && old != device.contents.end())
            to->second = *old->second;
        ApplyData(step, fates[i], to->second);
    }
    static Content const empty = std::make_shared<std::string const>();
    Image image;
    for (auto const& [name, file] : names) {
        auto const fresh = changed.find(file);
        auto const old = device.contents.find(file);
        if (fresh != changed.end())
            image[name] = std::make_shared<std::string const>(fresh->second);
        else
            image[name] = old != device.contents.end() && old->second ? old->second : empty;
    }
    return image;
}

class Maker
{
public:
    Maker(CrashPlan const& plan, std::function<void(Image const&, u64)> const& visit) : m_plan(plan), m_visit(visit) {}

    void MakeAll(Device const& device, u64 steps)
    {
        m_device = &device;
        m_steps = steps;
        u64 const n = device.pending.size();
        if (n <= c_allSubsets) {
            for (u64 bits = 0; bits < u64{1} << n; ++bits) Subset([&](u64 i) { return (bits >> i & 1) != 0; });
        } else {
            for (u64 cut = 0; cut <= n; ++cut) {
                Subset([&](u64 i) { return i < cut; });
                Subset([&](u64 i) { return i >= cut; });
            }
            for (u64 a = 0; a < n; ++a)
                for (u64 b = a; b < n; ++b) Subset([&](u64 i) { return i == a || i == b; });
            std::mt19937_64 random(steps);
            for (unsigned seed = 0; seed < m_plan.seededSubsets; ++seed) Subset([&](u64) { return random() % 2 == 0; });
        }
        for (u64 i = 0; i < n; ++i)
            if (device.pending[i]->kind == Kind::Write) Tear(i);
    }

private:
    template <class Keeps>
    void Subset(Keeps&& keeps)
    {
        Fates fates(m_device->pending.size());
        for (u64 i = 0; i < fates.size(); ++i) fates[i].kept = keeps(i);
        m_visit(MakeImage(*m_device, fates), m_steps);
    }

    // One torn write, with everything before it, with everything else, and alone.
    void Torn(u64 torn, Fate const& fate)
    {
        u64 const n = m_device->pending.size();
        for (int company = 0; company < 3; ++company) {
            Fates fates(n);
            for (u64 i = 0; i < n; ++i) fates[i].kept = company == 1 || (company == 0 && i < torn);
            fates[torn] = fate;
            m_visit(MakeImage(*m_device, fates), m_steps);
        }
    }

    void Tear(u64 i)
    {
        Step const& write = *m_device->pending[i];
        u64 const size = write.data.size();
        if (size <= c_tornAnywhere) {
            for (u64 cut = 1; cut < size; ++cut) Torn(i, {.kept = true, .end = cut});
            if (write.offset >= c_fixedPart) return;
            for (u64 cut = 1; cut < size; ++cut) Torn(i, {.kept = true, .begin = cut});
            for (u64 mix = 1; mix <= m_plan.mixes * size / c_tornAnywhere; ++mix)
                Torn(i, {.kept = true, .mix = m_steps * 7919 + mix});
            return;
        }
        u64 const first = (write.offset / c_sector + 1) * c_sector - write.offset;
        u64 const count = first < size ? (size - first + c_sector - 1) / c_sector : 0;
        u64 const stride = std::max<u64>(1, count / std::max(1u, m_plan.borders));
        for (u64 k = 0; k < count; k += stride) Torn(i, {.kept = true, .end = first + k * c_sector});
    }

    CrashPlan const& m_plan;
    std::function<void(Image const&, u64)> const& m_visit;
    Device const* m_device = nullptr;
    u64 m_steps = 0;
};

Device DeviceAfter(MemoryDisk::Recording const& recording, u64 steps)
{
    Device device{recording.names, recording.contents, {}};
    for (u64 i = 0; i < std::min<u64>(steps, recording.steps.size()); ++i) Advance(device, recording.steps[i]);
    return device;
}

} // namespace

void ForEachCrashImage(MemoryDisk::Recording const& recording, CrashPlan const& plan,
                       std::function<void(MemoryDisk::Image const&, u64 steps)> const& visit)
{
    Device device{recording.names, recording.contents, {}};
    Maker maker(plan, visit);
    for (u64 i = 0; i < recording.steps.size(); ++i) {
        Kind const kind = recording.steps[i].kind;
        if (kind == Kind::Flush || kind == Kind::FlushFolder) maker.MakeAll(device, i);
        Advance(device, recording.steps[i]);
    }
    maker.MakeAll(device, recording.steps.size());
}

MemoryDisk::Image MakeCrashImage(MemoryDisk::Recording const& recording, u64 steps, u64 seed)
{
    Device const device = DeviceAfter(recording, steps);
    std::mt19937_64 random(seed);
    Fates fates(device.pending.size());
    for (u64 i = 0; i < fates.size(); ++i) {
        fates[i].kept = random() % 2 == 0;
        u64 const size = device.pending[i]->data.size();
        if (random() % 4 != 0 || size == 0) continue;
        u64 const cut = random() % size;
        u64 const border = (device.pending[i]->offset + cut) / c_sector * c_sector;
        fates[i].end = size <= c_tornAnywhere ? cut : border - std::min<u64>(border, device.pending[i]->offset);
    }
    return MakeImage(device, fates);
}

MemoryDisk::Image MakeDurableImage(MemoryDisk::Recording const& recording, u64 steps)
{
    return MakeImage(DeviceAfter(recording, steps), {});
}

u64 HashImage(MemoryDisk::Image const& image)
{
    u64 hash = 0;
    auto const add = [&](std::string const& text) {
        hash = (hash ^ std::hash<std::string_view>()(text)) * 0x9E3779B97F4A7C15u;
        hash ^= hash >> 32;
    };
    for (auto const& [name, content] : image) {
        add(name);
        add(*content);
    }
    return hash;
}

} // namespace TestSupport
