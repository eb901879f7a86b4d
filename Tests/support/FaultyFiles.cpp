#include "support/FaultyFiles.h"

#include <algorithm>
#include <atomic>
#include <map>
#include <mutex>

namespace TestSupport {
namespace {

using namespace Kernel;
using namespace Kernel::Platform;

struct Planned
{
    Fault fault;
    int seen = 0;
};

// What a device flush that loses its pages would give back: the content at the last flush that went well.
struct OpenFile
{
    std::string path;
    std::string flushed;
    bool known = false;
    bool canKnow = false; // Open for reading and writing.
};

struct State
{
    std::mutex mutex;
    std::atomic<FileCalls const*> next = nullptr; // Calls of other threads may be under way while tables change.
    std::vector<Planned> plans;
    int counts[static_cast<int>(FileCall::Count)] = {};
    int openHandles = 0;
    bool fired = false;
    bool keepsFlushed = false;
    std::map<FileHandle, OpenFile> files;
    std::function<void(FileCall, std::string const&)> observer;
};

State s;

std::string PathOf(FileHandle handle)
{
    std::lock_guard const lock(s.mutex);
    auto const found = s.files.find(handle);
    return found == s.files.end() ? std::string() : found->second.path;
}

// Counts the call and tells whether a fault strikes.
bool Strikes(FileCall call, std::string const& path, Fault& out)
{
    if (s.observer) s.observer(call, path);
    std::lock_guard const lock(s.mutex);
    ++s.counts[static_cast<int>(call)];
    bool strikes = false;
    for (Planned& plan : s.plans) {
        if (plan.fault.call != call) continue;
        if (!plan.fault.path.empty() && path.find(plan.fault.path) == std::string::npos) continue;
        ++plan.seen;
        if (strikes || plan.seen < plan.fault.n || (plan.seen > plan.fault.n && !plan.fault.forEver)) continue;
        out = plan.fault;
        strikes = s.fired = true;
    }
    return strikes;
}

std::string Text(char const* path)
{
    return path ? path : "";
}

// What a call is about, by its first arguments.
template <class... Rest>
std::string PlaceOf(FileHandle handle, Rest&&...)
{
    return PathOf(handle);
}
template <class... Rest>
std::string PlaceOf(char const* path, Rest&&...)
{
    return Text(path);
}
std::string PlaceOf(char const* from, char const* to)
{
    return Text(from) + "\n" + Text(to);
}

std::string Content(FileHandle handle)
{
    u64 size = 0;
    FileCalls const& calls = *s.next;
    if (calls.getSize(handle, size)) return {};
    std::string text(size, '\0');
    text.resize(calls.readAt(handle, text.data(), size, 0).count);
    return text;
}

u64 PartOf(Fault const& fault, u64 size)
{
    if (fault.part == Fault::Part::Half) return size / 2;
    return fault.part == Fault::Part::AllButOne && size > 0 ? size - 1 : 0;
}

// A call of the table before, unless a fault strikes.
template <FileCall c_call, auto Member>
struct Faulty;
template <FileCall c_call, class... P, int (*FileCalls::*Member)(P...)>
struct Faulty<c_call, Member>
{
    static int Call(P... p)
    {
        Fault fault;
        return Strikes(c_call, PlaceOf(p...), fault) ? fault.error : (s.next.load()->*Member)(p...);
    }
};
template <FileCall c_call, class Data, class... Offset,
          IoResult (*FileCalls::*Member)(FileHandle, Data*, u64, Offset...)>
struct Faulty<c_call, Member>
{
    static IoResult Call(FileHandle handle, Data* data, u64 size, Offset... offset)
    {
        Fault fault;
        bool const strikes = Strikes(c_call, PathOf(handle), fault);
        IoResult result = (s.next.load()->*Member)(handle, data, strikes ? PartOf(fault, size) : size, offset...);
        if (strikes) result.error = fault.error;
        return result;
    }
};

int Open(char const* path, OpenFlags const& flags, FileHandle& out)
{
    int const error = Faulty<FileCall::Open, &FileCalls::open>::Call(path, flags, out);
    if (error) {
        out = c_noHandle;
        return error;
    }
    std::lock_guard const lock(s.mutex);
    OpenFile& file = s.files[out] = {Text(path), {}, false, flags.write && flags.read};
    if (s.keepsFlushed && file.canKnow) file.flushed = Content(out), file.known = true;
    ++s.openHandles;
    return 0;
}

// A failed close has closed all the same.
int Close(FileHandle handle)
{
    Fault fault;
    bool const strikes = Strikes(FileCall::Close, PathOf(handle), fault);
    {
        std::lock_guard const lock(s.mutex);
        if (s.files.erase(handle)) --s.openHandles;
    }
    int const error = s.next.load()->close(handle);
    return strikes ? fault.error : error;
}

int Flush(FileHandle handle, FlushKind kind)
{
    Fault fault;
    bool const strikes = Strikes(FileCall::Flush, PathOf(handle), fault);
    int const error = strikes ? fault.error : s.next.load()->flush(handle, kind);
    std::lock_guard const lock(s.mutex);
    OpenFile& file = s.files[handle];
    if (!error && file.known) file.flushed = Content(handle);
    if (strikes && fault.loseWrites && file.known) {
        FileCalls const& calls = *s.next;
        calls.setSize(handle, file.flushed.size());
        calls.writeAt(handle, file.flushed.data(), file.flushed.size(), 0);
    }
    return error;
}

template <FileCall c_call, auto... Members>
void PutFaulty(FileCalls& table)
{
    ((table.*Members = Faulty<c_call, Members>::Call), ...);
}

// What has no kind here goes straight to the table that was in place.
FileCalls MakeTable(FileCalls const& next)
{
    using C = FileCall;
    using F = FileCalls;
    FileCalls t = next;
    t.open = Open;
    t.close = Close;
    t.flush = Flush;
    PutFaulty<C::Read, &F::read, &F::readAt>(t);
    PutFaulty<C::Write, &F::write, &F::writeAt>(t);
    PutFaulty<C::Seek, &F::seek>(t);
    PutFaulty<C::GetSize, &F::getSize>(t);
    PutFaulty<C::SetSize, &F::setSize>(t);
    PutFaulty<C::Stat, &F::stat, &F::statHandle>(t);
    PutFaulty<C::Access, &F::access>(t);
    PutFaulty<C::Rename, &F::rename>(t);
    PutFaulty<C::Unlink, &F::unlink>(t);
    PutFaulty<C::MakeFolder, &F::makeFolder>(t);
    PutFaulty<C::RemoveFolder, &F::removeFolder>(t);
    PutFaulty<C::ReadLink, &F::readLink>(t);
    PutFaulty<C::ListFolder, &F::listFolder>(t);
    PutFaulty<C::FlushFolder, &F::flushFolder>(t);
    PutFaulty<C::GetAttribute, &F::getAttribute>(t);
    PutFaulty<C::SetAttributes, &F::setTimes, &F::setTimesHandle, &F::setMode, &F::setModeHandle, &F::setAttribute,
              &F::removeAttribute>(t);
    return t;
}

} // namespace

FaultyFiles::FaultyFiles()
{
    static FileCalls table;
    std::lock_guard const lock(s.mutex);
    // Where nothing changes nothing is written: a thread may still be within a call from the last time.
    if (FileCalls const* const next = &GetFileCalls(); s.next != next) {
        s.next = next;
        table = MakeTable(*next);
    }
    s.plans.clear();
    s.files.clear();
    std::fill(std::begin(s.counts), std::end(s.counts), 0);
    s.openHandles = 0;
    s.fired = s.keepsFlushed = false;
    SetFileCalls(&table);
}

FaultyFiles::~FaultyFiles()
{
    SetFileCalls(s.next);
    s.observer = nullptr;
}

void FaultyFiles::Plan(Fault const& fault)
{
    std::lock_guard const lock(s.mutex);
    s.plans.push_back({fault});
    s.fired = false;
    if (!fault.loseWrites || s.keepsFlushed) return;
    s.keepsFlushed = true;
    for (auto& [handle, file] : s.files)
        if (file.canKnow) file.flushed = Content(handle), file.known = true;
}

void FaultyFiles::Clear()
{
    std::lock_guard const lock(s.mutex);
    s.plans.clear();
}

bool FaultyFiles::HasFired() const
{
    std::lock_guard const lock(s.mutex);
    return s.fired;
}

int FaultyFiles::GetCount(FileCall call) const
{
    std::lock_guard const lock(s.mutex);
    return s.counts[static_cast<int>(call)];
}

void FaultyFiles::ResetCounts()
{
    std::lock_guard const lock(s.mutex);
    std::fill(std::begin(s.counts), std::end(s.counts), 0);
}

int FaultyFiles::GetOpenHandles() const
{
    std::lock_guard const lock(s.mutex);
    return s.openHandles;
}

void FaultyFiles::SetObserver(std::function<void(FileCall, std::string const&)> observer)
{
    s.observer = std::move(observer);
}

int ForEachFault(Fault fault, std::function<void(FaultyFiles&)> const& operation,
                 std::function<void(int n)> const& check, int most)
{
    for (int n = 1; n <= most; ++n) {
        bool fired = false;
        {
            FaultyFiles files;
            fault.n = n;
            files.Plan(fault);
            operation(files);
            fired = files.HasFired();
        }
        check(n);
        if (!fired) return n - 1;
    }
    return most;
}

} // namespace TestSupport
