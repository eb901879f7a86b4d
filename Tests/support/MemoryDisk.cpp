#include "support/MemoryDisk.h"

#include "libkernel/platform/PlatformFile.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <set>

namespace TestSupport {
namespace {

using namespace Kernel;
using namespace Kernel::Platform;

constexpr FileHandle c_firstHandle = 1 << 20; // Far above what the system gives out.
constexpr u64 c_device = 0x52414D;

struct Node
{
    u64 number = 0;
    std::string data;
    std::map<std::string, std::string> attributes;
    i64 modified = 0;
    u32 mode = 0644;
    int writers = 0; // Open handles that write, and that deny writing.
    int deniers = 0;
};
using NodePtr = std::shared_ptr<Node>;

struct OpenFile
{
    NodePtr node;
    OpenFlags flags;
    u64 position = 0;
};

struct State
{
    std::mutex mutex;
    FileCalls const* next = nullptr;
    std::map<std::string, NodePtr> names;
    std::set<std::string> folders;
    std::map<FileHandle, OpenFile> handles;
    FileHandle nextHandle = c_firstHandle;
    u64 lastNumber = 0;
    bool recording = false;
    MemoryDisk::Recording record;
};

State s;

bool IsMine(char const* path)
{
    size_t const n = std::strlen(MemoryDisk::c_root);
    return path && std::strncmp(path, MemoryDisk::c_root, n) == 0 && (path[n] == '/' || path[n] == 0);
}

std::string Trim(char const* path)
{
    std::string text = path;
    while (text.size() > 1 && text.back() == '/') text.pop_back();
    return text;
}

std::string FolderOf(std::string const& path)
{
    return path.substr(0, path.rfind('/'));
}

void Note(MemoryDisk::Step step)
{
    if (s.recording) s.record.steps.push_back(std::move(step));
}

NodePtr Find(std::string const& path)
{
    auto const found = s.names.find(path);
    return found == s.names.end() ? nullptr : found->second;
}

int Open(char const* text, OpenFlags const& flags, FileHandle& out)
{
    out = c_noHandle;
    if (!IsMine(text)) return s.next->open(text, flags, out);
    std::lock_guard const lock(s.mutex);
    std::string const path = Trim(text);
    if (s.folders.count(path)) return EISDIR;
    NodePtr node = Find(path);
    if (node && flags.create && flags.exclusive) return EEXIST;
    if (!node && (!flags.create || !s.folders.count(FolderOf(path)))) return ENOENT;
    if (node && ((flags.write && node->deniers > 0) || (flags.share == FileShare::DenyWrite && node->writers > 0)))
        return EACCES;
    if (!node) {
        node = std::make_shared<Node>();
        node->number = ++s.lastNumber;
        s.names[path] = node;
        Note({.kind = MemoryDisk::Kind::Create, .file = node->number, .name = path});
    } else if (flags.truncate && flags.write) {
        node->data.clear();
        Note({.kind = MemoryDisk::Kind::SetSize, .file = node->number});
    }
    node->writers += flags.write;
    node->deniers += flags.share == FileShare::DenyWrite;
    out = s.nextHandle++;
    s.handles[out] = {node, flags};
    return 0;
}

// Runs @p mine on the open file, or @p theirs if the handle is the system's.
template <class Result, class Mine, class Theirs>
Result OnHandle(FileHandle handle, Result bad, Mine&& mine, Theirs&& theirs)
{
    if (handle < c_firstHandle) return theirs();
    std::lock_guard const lock(s.mutex);
    auto const found = s.handles.find(handle);
    return found == s.handles.end() ? bad : mine(found->second);
}

int Close(FileHandle handle)
{
    auto const mine = [&](OpenFile& file) {
        file.node->writers -= file.flags.write;
        file.node->deniers -= file.flags.share == FileShare::DenyWrite;
        s.handles.erase(handle);
        return 0;
    };
    return OnHandle(handle, EBADF, mine, [&] { return s.next->close(handle); });
}

IoResult ReadFrom(OpenFile const& file, void* data, u64 size, u64 offset)
{
    if (!file.flags.read) return {0, EBADF};
    std::string const& from = file.node->data;
    u64 const count = offset < from.size() ? std::min<u64>(size, from.size() - offset) : 0;
    if (count > 0) std::memcpy(data, from.data() + offset, count);
    return {count, 0};
}

IoResult WriteTo(OpenFile& file, void const* data, u64 size, u64 offset)
{
    if (!file.flags.write) return {0, EBADF};
    if (size == 0) return {0, 0};
    std::string& to = file.node->data;
    if (to.size() < offset + size) to.resize(offset + size, '\0');
    std::memcpy(to.data() + offset, data, size);
    Note({.kind = MemoryDisk::Kind::Write,
          .file = file.node->number,
          .offset = offset,
          .data = std::string(static_cast<char const*>(data), size)});
    return {size, 0};
}

constexpr IoResult c_badRead{0, EBADF};

IoResult Read(FileHandle h, void* data, u64 size)
{
    auto const mine = [&](OpenFile& file) {
        IoResult const result = ReadFrom(file, data, size, file.position);
        file.position += result.count;
        return result;
    };
    return OnHandle(h, c_badRead, mine, [&] { return s.next->read(h, data, size); });
}

IoResult ReadAt(FileHandle h, void* data, u64 size, u64 offset)
{
    auto const mine = [&](OpenFile& file) { return ReadFrom(file, data, size, offset); };
    return OnHandle(h, c_badRead, mine, [&] { return s.next->readAt(h, data, size, offset); });
}

IoResult Write(FileHandle h, void const* data, u64 size)
{
    auto const mine = [&](OpenFile& file) {
        if (file.flags.append) file.position = file.node->data.size();
        IoResult const result = WriteTo(file, data, size, file.position);
        file.position += result.count;
        return result;
    };
    return OnHandle(h, c_badRead, mine, [&] { return s.next->write(h, data, size); });
}

IoResult WriteAt(FileHandle h, void const* data, u64 size, u64 offset)
{
    auto const mine = [&](OpenFile& file) { return WriteTo(file, data, size, offset); };
    return OnHandle(h, c_badRead, mine, [&] { return s.next->writeAt(h, data, size, offset); });
}

int Seek(FileHandle h, i64 offset, SeekFrom from, u64& position)
{
    auto const mine = [&](OpenFile& file) {
        i64 const base = from == SeekFrom::Start     ? 0
                         : from == SeekFrom::Current ? static_cast<i64>(file.position)
                                                     : static_cast<i64>(file.node->data.size());
        if (base + offset < 0) return EINVAL;
        position = file.position = static_cast<u64>(base + offset);
        return 0;
    };
    return OnHandle(h, EBADF, mine, [&] { return s.next->seek(h, offset, from, position); });
}

int GetSize(FileHandle h, u64& size)
{
    auto const mine = [&](OpenFile& file) {
        size = file.node->data.size();
        return 0;
    };
    return OnHandle(h, EBADF, mine, [&] { return s.next->getSize(h, size); });
}

int SetSize(FileHandle h, u64 size)
{
    auto const mine = [&](OpenFile& file) {
        file.node->data.resize(size, '\0');
        Note({.kind = MemoryDisk::Kind::SetSize, .file = file.node->number, .offset = size});
        return 0;
    };
    return OnHandle(h, EBADF, mine, [&] { return s.next->setSize(h, size); });
}

int Flush(FileHandle h, FlushKind kind)
{
    auto const mine = [&](OpenFile& file) {
        Note({.kind = MemoryDisk::Kind::Flush, .file = file.node->number});
        return 0;
    };
    return OnHandle(h, EBADF, mine, [&] { return s.next->flush(h, kind); });
}

int Inform(Node const& node, FileInfo& info)
{
    info = {};
    info.kind = FileKind::File;
    info.size = info.allocated = node.data.size();
    info.device = c_device;
    info.inode = node.number;
    info.mode = node.mode;
    info.accessTime = info.modifyTime = info.changeTime = node.modified;
    return 0;
}

int StatHandle(FileHandle h, FileInfo& info)
{
    auto const mine = [&](OpenFile& file) { return Inform(*file.node, info); };
    return OnHandle(h, EBADF, mine, [&] { return s.next->statHandle(h, info); });
}

int SetTimesHandle(FileHandle h, i64 access, i64 modify)
{
    auto const mine = [&](OpenFile& file) {
        if (modify != c_keepTime) file.node->modified = modify;
        return 0;
    };
    return OnHandle(h, EBADF, mine, [&] { return s.next->setTimesHandle(h, access, modify); });
}

int SetModeHandle(FileHandle h, u32 mode)
{
    auto const mine = [&](OpenFile& file) {
        file.node->mode = mode;
        return 0;
    };
    return OnHandle(h, EBADF, mine, [&] { return s.next->setModeHandle(h, mode); });
}

// Runs @p mine on the file at the path, or @p theirs if the path is not on this disk.
template <class Mine, class Theirs>
int OnPath(char const* text, Mine&& mine, Theirs&& theirs)
{
    if (!IsMine(text)) return theirs();
    std::lock_guard const lock(s.mutex);
    NodePtr const node = Find(Trim(text));
    return node ? mine(*node) : ENOENT;
}

int Stat(char const* text, bool follow, FileInfo& info)
{
    info = {};
    if (!IsMine(text)) return s.next->stat(text, follow, info);
    std::lock_guard const lock(s.mutex);
    std::string const path = Trim(text);
    if (s.folders.count(path)) {
        info.kind = FileKind::Folder;
        info.device = c_device;
        info.mode = 0755;
        return 0;
    }
    NodePtr const node = Find(path);
    return node ? Inform(*node, info) : ENOENT;
}

int CheckAccess(char const* text, Access access)
{
    FileInfo info;
    return IsMine(text) ? Stat(text, true, info) : s.next->access(text, access);
}

int Rename(char const* a, char const* b)
{
    if (!IsMine(a) && !IsMine(b)) return s.next->rename(a, b);
    if (!IsMine(a) || !IsMine(b)) return EXDEV;
    std::lock_guard const lock(s.mutex);
    std::string const from = Trim(a);
    std::string const to = Trim(b);
    NodePtr const node = Find(from);
    if (!node || !s.folders.count(FolderOf(to))) return ENOENT;
    s.names[to] = node;
    s.names.erase(from);
    Note({.kind = MemoryDisk::Kind::Rename, .file = node->number, .name = from, .to = to});
    return 0;
}

int Unlink(char const* text)
{
    if (!IsMine(text)) return s.next->unlink(text);
    std::lock_guard const lock(s.mutex);
    std::string const path = Trim(text);
    if (!s.names.erase(path)) return ENOENT;
    Note({.kind = MemoryDisk::Kind::Unlink, .name = path});
    return 0;
}

int MakeFolder(char const* text)
{
    if (!IsMine(text)) return s.next->makeFolder(text);
    std::lock_guard const lock(s.mutex);
    return s.folders.insert(Trim(text)).second ? 0 : EEXIST;
}

int ListFolder(char const* text, std::vector<FolderEntry>& entries)
{
    if (!IsMine(text)) return s.next->listFolder(text, entries);
    std::lock_guard const lock(s.mutex);
    std::string const path = Trim(text);
    if (!s.folders.count(path)) return ENOENT;
    entries.clear();
    for (auto const& [name, node] : s.names) {
        if (FolderOf(name) == path) entries.push_back({name.substr(path.size() + 1), FileKind::File});
    }
    return 0;
}

int FlushFolder(char const* text)
{
    if (!IsMine(text)) return s.next->flushFolder(text);
    std::lock_guard const lock(s.mutex);
    Note({.kind = MemoryDisk::Kind::FlushFolder, .name = Trim(text)});
    return 0;
}

int GetAttribute(char const* path, char const* name, std::string& value)
{
    auto const mine = [&](Node& node) {
        auto const found = node.attributes.find(name);
        if (found == node.attributes.end()) return ENODATA;
        value = found->second;
        return 0;
    };
    return OnPath(path, mine, [&] { return s.next->getAttribute(path, name, value); });
}

int SetAttribute(char const* path, char const* name, void const* data, u64 size)
{
    auto const mine = [&](Node& node) {
        node.attributes[name] = std::string(static_cast<char const*>(data), size);
        return 0;
    };
    return OnPath(path, mine, [&] { return s.next->setAttribute(path, name, data, size); });
}

int RemoveAttribute(char const* path, char const* name)
{
    auto const mine = [&](Node& node) { return node.attributes.erase(name) ? 0 : ENODATA; };
    return OnPath(path, mine, [&] { return s.next->removeAttribute(path, name); });
}

FileCalls MakeTable(FileCalls const& next)
{
    FileCalls t = next;
    t.open = Open;
    t.close = Close;
    t.read = Read;
    t.write = Write;
    t.readAt = ReadAt;
    t.writeAt = WriteAt;
    t.seek = Seek;
    t.getSize = GetSize;
    t.setSize = SetSize;
    t.flush = Flush;
    t.statHandle = StatHandle;
    t.stat = Stat;
    t.access = CheckAccess;
    t.rename = Rename;
    t.unlink = Unlink;
    t.makeFolder = MakeFolder;
    t.listFolder = ListFolder;
    t.flushFolder = FlushFolder;
    t.setTimesHandle = SetTimesHandle;
    t.setModeHandle = SetModeHandle;
    t.getAttribute = GetAttribute;
    t.setAttribute = SetAttribute;
    t.removeAttribute = RemoveAttribute;
    t.readLink = [](char const* p, std::string& o) { return IsMine(p) ? EINVAL : s.next->readLink(p, o); };
    t.setTimes = [](char const* p, i64 a, i64 m) {
        return OnPath(
            p, [&](Node& n) { return n.modified = m == c_keepTime ? n.modified : m, 0; },
            [&] { return s.next->setTimes(p, a, m); });
    };
    t.setMode = [](char const* p, u32 mode) {
        return OnPath(
            p, [&](Node& n) { return n.mode = mode, 0; }, [&] { return s.next->setMode(p, mode); });
    };
    t.advise = [](FileHandle h, u64 o, u64 n, ReadAdvice a) {
        return h < c_firstHandle ? s.next->advise(h, o, n, a) : 0;
    };
    t.startWriteBack = [](FileHandle h, u64 o, u64 n) {
        return h < c_firstHandle ? s.next->startWriteBack(h, o, n) : 0;
    };
    t.reserve = [](FileHandle h, u64 o, u64 n) { return h < c_firstHandle ? s.next->reserve(h, o, n) : 0; };
    return t;
}

FileCalls s_table;

} // namespace

MemoryDisk::MemoryDisk()
{
    std::lock_guard const lock(s.mutex);
    s.next = &GetFileCalls();
    s.names.clear();
    s.handles.clear();
    s.folders = {c_root};
    s.recording = false;
    s_table = MakeTable(*s.next);
    SetFileCalls(&s_table);
}

MemoryDisk::~MemoryDisk()
{
    SetFileCalls(s.next);
}

void MemoryDisk::Load(Image const& image)
{
    std::lock_guard const lock(s.mutex);
    s.names.clear();
    for (auto const& [path, content] : image) {
        auto node = std::make_shared<Node>();
        node->number = ++s.lastNumber;
        node->data = *content;
        s.names[path] = std::move(node);
    }
}

MemoryDisk::Image MemoryDisk::GetImage() const
{
    std::lock_guard const lock(s.mutex);
    Image image;
    for (auto const& [path, node] : s.names) image[path] = std::make_shared<std::string const>(node->data);
    return image;
}

void MemoryDisk::StartRecording()
{
    std::lock_guard const lock(s.mutex);
    s.record = {};
    for (auto const& [path, node] : s.names) {
        s.record.names[path] = node->number;
        s.record.contents[node->number] = std::make_shared<std::string const>(node->data);
    }
    s.recording = true;
}

MemoryDisk::Recording MemoryDisk::StopRecording()
{
    std::lock_guard const lock(s.mutex);
    s.recording = false;
    return std::move(s.record);
}

u64 MemoryDisk::GetOpenHandles() const
{
    std::lock_guard const lock(s.mutex);
    return s.handles.size();
}

std::string Describe(MemoryDisk::Step const& step)
{
    static constexpr char const* c_names[] = {"write",  "set size", "flush",       "create",
                                              "rename", "unlink",   "flush folder"};
    std::string text = c_names[static_cast<int>(step.kind)];
    if (!step.name.empty()) text += " " + step.name;
    if (!step.to.empty()) text += " to " + step.to;
    if (step.file) text += " #" + std::to_string(step.file);
    if (step.kind == MemoryDisk::Kind::Write)
        text += " at " + std::to_string(step.offset) + " x " + std::to_string(step.data.size());
    return text;
}

} // namespace TestSupport
