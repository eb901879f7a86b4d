#include "support/CrashRecorder.h"

#include "libkernel/platform/PlatformFile.h"
#include "support/TempFolder.h"

#include <algorithm>
#include <filesystem>
#include <map>
#include <mutex>
#include <random>
#include <vector>

namespace TestSupport {
namespace {

using namespace Kernel;
using namespace Kernel::Platform;

// A file is known by a number of its own: the device's number comes again after a file has been removed.
using FileNumber = u64;

enum class Kind
{
    Write,
    SetSize,
    Flush,
    Create,
    Rename,
    Unlink,
    FlushFolder
};
constexpr char const* c_kindNames[] = {"write", "set size", "flush", "create", "rename", "unlink", "flush folder"};

struct Step
{
    Kind kind;
    FileNumber file = 0;
    u64 offset = 0; // Or the new size.
    std::string data = {};
    std::string name = {}; // Within the folder.
    std::string to = {};
};

struct State
{
    std::mutex mutex;
    FileCalls const* next = nullptr;
    std::string folder;
    std::map<std::string, FileNumber> firstNames;
    std::map<FileNumber, std::string> firstContents;
    std::map<std::string, FileNumber> names; // As a program sees them now.
    std::map<FileHandle, FileNumber> handles;
    std::map<FileHandle, bool> appends;
    FileNumber lastNumber = 0;
    std::vector<Step> steps;
};

State s;

// The name within the recorded folder; empty for a path outside it.
std::string NameOf(char const* path)
{
    std::string const text = path ? path : "";
    if (text.size() <= s.folder.size() + 1 || text.compare(0, s.folder.size(), s.folder) != 0) return {};
    std::string const name = text.substr(s.folder.size() + 1);
    return text[s.folder.size()] == '/' && name.find('/') == std::string::npos ? name : std::string();
}

FileNumber FileOf(FileHandle handle)
{
    auto const found = s.handles.find(handle);
    return found == s.handles.end() ? 0 : found->second;
}

int Open(char const* path, OpenFlags const& flags, FileHandle& out)
{
    std::lock_guard const lock(s.mutex);
    int const error = s.next->open(path, flags, out);
    std::string const name = NameOf(path);
    if (error || name.empty()) return error;
    FileNumber& number = s.names[name];
    bool const made = number == 0;
    if (made) {
        number = ++s.lastNumber;
        s.steps.push_back({.kind = Kind::Create, .file = number, .name = name});
    }
    s.handles[out] = number;
    s.appends[out] = flags.append;
    if (!made && flags.truncate && flags.write) s.steps.push_back({.kind = Kind::SetSize, .file = number});
    return 0;
}

int Close(FileHandle handle)
{
    std::lock_guard const lock(s.mutex);
    s.handles.erase(handle);
    return s.next->close(handle);
}

void NoteWrite(FileHandle handle, void const* data, u64 count, u64 offset)
{
    FileNumber const file = FileOf(handle);
    if (file == 0 || count == 0) return;
    s.steps.push_back({.kind = Kind::Write,
                       .file = file,
                       .offset = offset,
                       .data = std::string(static_cast<char const*>(data), count)});
}

IoResult Write(FileHandle handle, void const* data, u64 size)
{
    std::lock_guard const lock(s.mutex);
    IoResult const result = s.next->write(handle, data, size);
    u64 end = 0; // The position after the write tells where it went, for appending handles too.
    if (result.count > 0 && GetSystemFileCalls().seek(handle, 0, SeekFrom::Current, end) == 0)
        NoteWrite(handle, data, result.count, end - result.count);
    return result;
}

IoResult WriteAt(FileHandle handle, void const* data, u64 size, u64 offset)
{
    std::lock_guard const lock(s.mutex);
    IoResult const result = s.next->writeAt(handle, data, size, offset);
    NoteWrite(handle, data, result.count, offset);
    return result;
}

int SetSize(FileHandle handle, u64 size)
{
    std::lock_guard const lock(s.mutex);
    int const error = s.next->setSize(handle, size);
    if (!error && FileOf(handle)) s.steps.push_back({.kind = Kind::SetSize, .file = FileOf(handle), .offset = size});
    return error;
}

int Flush(FileHandle handle, FlushKind kind)
{
    std::lock_guard const lock(s.mutex);
    int const error = s.next->flush(handle, kind);
    if (!error && FileOf(handle)) s.steps.push_back({.kind = Kind::Flush, .file = FileOf(handle)});
    return error;
}

// A file that comes from outside the folder is taken as new, with its content unflushed; one that leaves it is gone.
int Rename(char const* from, char const* to)
{
    std::lock_guard const lock(s.mutex);
    std::string const a = NameOf(from);
    std::string const b = NameOf(to);
    std::string const arriving = a.empty() && !b.empty() ? ReadWholeFile(from) : std::string();
    if (int const error = s.next->rename(from, to)) return error;
    if (!a.empty() && !b.empty()) {
        s.names[b] = s.names[a];
        s.names.erase(a);
        s.steps.push_back({.kind = Kind::Rename, .name = a, .to = b});
    } else if (!b.empty()) {
        FileNumber const number = s.names[b] = ++s.lastNumber;
        s.steps.push_back({.kind = Kind::Create, .file = number, .name = b});
        s.steps.push_back({.kind = Kind::Write, .file = number, .data = arriving});
    } else if (!a.empty()) {
        s.names.erase(a);
        s.steps.push_back({.kind = Kind::Unlink, .name = a});
    }
    return 0;
}

int Unlink(char const* path)
{
    std::lock_guard const lock(s.mutex);
    int const error = s.next->unlink(path);
    std::string const name = NameOf(path);
    if (!error && s.names.erase(name)) s.steps.push_back({.kind = Kind::Unlink, .name = name});
    return error;
}

int FlushFolder(char const* path)
{
    std::lock_guard const lock(s.mutex);
    int const error = s.next->flushFolder(path);
    std::string text = path ? path : "";
    while (text.size() > 1 && text.back() == '/') text.pop_back();
    if (!error && text == s.folder) s.steps.push_back({.kind = Kind::FlushFolder});
    return error;
}

void Apply(Step const& step, std::string& content, u64 size)
{
    if (step.kind == Kind::SetSize) {
        content.resize(step.offset, '\0');
        return;
    }
    if (content.size() < step.offset + size) content.resize(step.offset + size, '\0');
    content.replace(step.offset, size, step.data, 0, size);
}

void Apply(Step const& step, std::map<std::string, FileNumber>& names)
{
    if (step.kind == Kind::Create) names[step.name] = step.file;
    if (step.kind == Kind::Unlink) names.erase(step.name);
    if (step.kind != Kind::Rename || !names.count(step.name)) return;
    names[step.to] = names[step.name];
    names.erase(step.name);
}

// Chooses what survives.
class Fate
{
public:
    explicit Fate(u64 seed) : m_seed(seed), m_random(seed) {}

    bool Survives(bool isName)
    {
        if (m_seed > CrashRecorder::c_namesOnly) return m_random() % 2 == 0;
        return m_seed == CrashRecorder::c_keepAll || (isName && m_seed == CrashRecorder::c_namesOnly);
    }

    u64 GetLength(Step const& write)
    {
        u64 const size = write.data.size();
        if (m_seed <= CrashRecorder::c_namesOnly || size == 0 || m_random() % 2 == 0) return size;
        u64 const cut = m_random() % (size + 1);
        if (size <= 64) return cut;
        u64 const border = (write.offset + cut) / 512 * 512;
        return border > write.offset ? border - write.offset : 0;
    }

private:
    u64 m_seed;
    std::mt19937_64 m_random;
};

FileCalls MakeTable(FileCalls const& next)
{
    FileCalls t = next;
    t.open = Open;
    t.close = Close;
    t.write = Write;
    t.writeAt = WriteAt;
    t.setSize = SetSize;
    t.flush = Flush;
    t.rename = Rename;
    t.unlink = Unlink;
    t.flushFolder = FlushFolder;
    return t;
}

FileCalls s_table;

} // namespace

CrashRecorder::CrashRecorder(std::string const& folder)
{
    std::lock_guard const lock(s.mutex);
    s.next = &GetFileCalls();
    s.folder = folder;
    s.names.clear();
    s.firstContents.clear();
    s.handles.clear();
    s.steps.clear();
    for (auto const& entry : std::filesystem::directory_iterator(folder)) {
        if (!entry.is_regular_file()) continue;
        FileNumber const number = s.names[entry.path().filename().string()] = ++s.lastNumber;
        s.firstContents[number] = ReadWholeFile(entry.path().string());
    }
    s.firstNames = s.names;
    s_table = MakeTable(*s.next);
    SetFileCalls(&s_table);
}

CrashRecorder::~CrashRecorder()
{
    SetFileCalls(s.next);
}

u64 CrashRecorder::GetStepCount() const
{
    std::lock_guard const lock(s.mutex);
    return s.steps.size();
}

std::string CrashRecorder::Describe(u64 step) const
{
    std::lock_guard const lock(s.mutex);
    if (step >= s.steps.size()) return "end";
    Step const& one = s.steps[step];
    std::string text = c_kindNames[static_cast<int>(one.kind)];
    if (!one.name.empty()) text += " " + one.name;
    if (!one.to.empty()) text += " to " + one.to;
    if (one.file) text += " #" + std::to_string(one.file);
    if (one.kind == Kind::Write) text += " at " + std::to_string(one.offset) + " x " + std::to_string(one.data.size());
    return text;
}

void CrashRecorder::MakeImage(u64 steps, u64 seed, std::string const& target) const
{
    std::lock_guard const lock(s.mutex);
    auto names = s.firstNames;
    auto contents = s.firstContents;
    std::map<FileNumber, std::vector<Step const*>> unflushed;
    std::vector<Step const*> unflushedNames;
    for (u64 i = 0; i < std::min<u64>(steps, s.steps.size()); ++i) {
        Step const& step = s.steps[i];
        switch (step.kind) {
        case Kind::Write:
        case Kind::SetSize: unflushed[step.file].push_back(&step); break;
        case Kind::Flush:
            for (Step const* one : unflushed[step.file]) Apply(*one, contents[step.file], one->data.size());
            unflushed[step.file].clear();
            break;
        case Kind::FlushFolder:
            for (Step const* one : unflushedNames) Apply(*one, names);
            unflushedNames.clear();
            break;
        default: unflushedNames.push_back(&step);
        }
    }
    Fate fate(seed);
    for (Step const* one : unflushedNames) {
        if (fate.Survives(true)) Apply(*one, names);
    }
    for (auto const& [file, writes] : unflushed) {
        for (Step const* one : writes) {
            if (fate.Survives(false)) Apply(*one, contents[file], fate.GetLength(*one));
        }
    }
    for (auto const& [name, file] : names) WriteWholeFile(target + "/" + name, contents[file]);
}

} // namespace TestSupport
