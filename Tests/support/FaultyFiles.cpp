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

template <class... Parameters, class... Arguments>
int Pass(FileCall call, std::string const& path, int (*next)(Parameters...), Arguments&&... arguments)
{
    Fault fault;
    return Strikes(call, path, fault) ? fault.error : next(std::forward<Arguments>(arguments)...);
}

std::string Text(char const* path)
{
    return path ? path : "";
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

template <class Data>
IoResult Move(FileCall call, FileHandle handle, Data* data, u64 size, IoResult (*next)(FileHandle, Data*, u64))
{
    Fault fault;
    if (!Strikes(call, PathOf(handle), fault)) return next(handle, data, size);
    IoResult result = next(handle, data, PartOf(fault, size));
    result.error = fault.error;
    return result;
}

template <class Data>
IoResult MoveAt(FileCall call, FileHandle handle, Data* data, u64 size, u64 offset,
                IoResult (*next)(FileHandle, Data*, u64, u64))
{
    Fault fault;
    if (!Strikes(call, PathOf(handle), fault)) return next(handle, data, size, offset);
    IoResult result = next(handle, data, PartOf(fault, size), offset);
    result.error = fault.error;
    return result;
}

int Open(char const* path, OpenFlags const& flags, FileHandle& out)
{
    int const error = Pass(FileCall::Open, Text(path), s.next.load()->open, path, flags, out);
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

// What has no kind here goes straight to the table that was in place.
FileCalls MakeTable(FileCalls const& next)
{
    using C = FileCall;
    FileCalls t = next;
    t.open = Open;
    t.close = Close;
    t.read = [](FileHandle h, void* d, u64 n) { return Move(C::Read, h, d, n, s.next.load()->read); };
    t.write = [](FileHandle h, void const* d, u64 n) { return Move(C::Write, h, d, n, s.next.load()->write); };
    t.readAt = [](FileHandle h, void* d, u64 n, u64 o) { return MoveAt(C::Read, h, d, n, o, s.next.load()->readAt); };
    t.writeAt = [](FileHandle h, void const* d, u64 n, u64 o) {
        return MoveAt(C::Write, h, d, n, o, s.next.load()->writeAt);
    };
    t.seek = [](FileHandle h, i64 o, SeekFrom f, u64& p) {
        return Pass(C::Seek, PathOf(h), s.next.load()->seek, h, o, f, p);
    };
    t.getSize = [](FileHandle h, u64& n) { return Pass(C::GetSize, PathOf(h), s.next.load()->getSize, h, n); };
    t.setSize = [](FileHandle h, u64 n) { return Pass(C::SetSize, PathOf(h), s.next.load()->setSize, h, n); };
    t.flush = Flush;
    t.statHandle = [](FileHandle h, FileInfo& i) { return Pass(C::Stat, PathOf(h), s.next.load()->statHandle, h, i); };
    t.stat = [](char const* p, bool f, FileInfo& i) { return Pass(C::Stat, Text(p), s.next.load()->stat, p, f, i); };
    t.access = [](char const* p, Access a) { return Pass(C::Access, Text(p), s.next.load()->access, p, a); };
    t.rename = [](char const* a, char const* b) {
        return Pass(C::Rename, Text(a) + "\n" + Text(b), s.next.load()->rename, a, b);
    };
    t.unlink = [](char const* p) { return Pass(C::Unlink, Text(p), s.next.load()->unlink, p); };
    t.makeFolder = [](char const* p) { return Pass(C::MakeFolder, Text(p), s.next.load()->makeFolder, p); };
    t.removeFolder = [](char const* p) { return Pass(C::RemoveFolder, Text(p), s.next.load()->removeFolder, p); };
    t.readLink = [](char const* p, std::string& o) {
        return Pass(C::ReadLink, Text(p), s.next.load()->readLink, p, o);
    };
    t.listFolder = [](char const* p, std::vector<FolderEntry>& e) {
        return Pass(C::ListFolder, Text(p), s.next.load()->listFolder, p, e);
    };
    t.flushFolder = [](char const* p) { return Pass(C::FlushFolder, Text(p), s.next.load()->flushFolder, p); };
    t.setTimes = [](char const* p, i64 a, i64 m) {
        return Pass(C::SetAttributes, Text(p), s.next.load()->setTimes, p, a, m);
    };
    t.setTimesHandle = [](FileHandle h, i64 a, i64 m) {
        return Pass(C::SetAttributes, PathOf(h), s.next.load()->setTimesHandle, h, a, m);
    };
    t.setMode = [](char const* p, u32 m) { return Pass(C::SetAttributes, Text(p), s.next.load()->setMode, p, m); };
    t.setModeHandle = [](FileHandle h, u32 m) {
        return Pass(C::SetAttributes, PathOf(h), s.next.load()->setModeHandle, h, m);
    };
    t.getAttribute = [](char const* p, char const* n, std::string& v) {
        return Pass(C::GetAttribute, Text(p), s.next.load()->getAttribute, p, n, v);
    };
    t.setAttribute = [](char const* p, char const* n, void const* d, u64 z) {
        return Pass(C::SetAttributes, Text(p), s.next.load()->setAttribute, p, n, d, z);
    };
    t.removeAttribute = [](char const* p, char const* n) {
        return Pass(C::SetAttributes, Text(p), s.next.load()->removeAttribute, p, n);
    };
    return t;
}

} // namespace

FaultyFiles::FaultyFiles()
{
    static FileCalls table;
    std::lock_guard const lock(s.mutex);
    s.next = &GetFileCalls();
    table = MakeTable(*s.next);
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
