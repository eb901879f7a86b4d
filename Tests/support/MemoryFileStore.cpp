#include "support/MemoryFileStore.h"

#include "libkernel/filestore/FileStoreOut.h"
#include "libkernel/streams/MemoryStreams.h"

namespace KernelTest {

namespace {

template <FileStoreItemType const& c_type>
Counted<FileStoreItem> MakeItem()
{
    return Counted<FileStoreItem>(new MemoryItem(String8(), &c_type));
}

// A copy runs, so that a hook may take itself out.
void RunHook(std::function<void()> const& hook)
{
    if (std::function<void()> const copy = hook) copy();
}

bool LoadBytes(String8 const& bytes, FileStoreItem& item, FileStore& store)
{
    Counted<MemoryInStream> const stream(
        new MemoryInStream(bytes.GetData(), static_cast<u64>(bytes.GetLength()), true));
    return item.Load(*stream, store);
}

} // namespace

FileStoreItemType const MemoryItem::c_plain(ClassUID("TsPl"), &MakeItem<c_plain>, FileStoreItemType::NotNestable,
                                            FileStoreItemType::NotRecoverable);
FileStoreItemType const MemoryItem::c_recoverable(ClassUID("TsRe"), &MakeItem<c_recoverable>,
                                                  FileStoreItemType::NotNestable, FileStoreItemType::IsRecoverableType);
FileStoreItemType const MemoryItem::c_nestable(ClassUID("TsNe"), &MakeItem<c_nestable>,
                                               FileStoreItemType::IsNestableType, FileStoreItemType::NotRecoverable);
static FileStoreItemType::Init const s_plain(MemoryItem::c_plain);
static FileStoreItemType::Init const s_recoverable(MemoryItem::c_recoverable);
static FileStoreItemType::Init const s_nestable(MemoryItem::c_nestable);

std::atomic<int> MemoryItem::s_living{0};

MemoryItem::MemoryItem(String8 const& t, FileStoreItemType const* type) : text(t), m_type(type)
{
    ++s_living;
}

MemoryItem::~MemoryItem()
{
    --s_living;
}

FileStoreItemType const* MemoryItem::TypeOf(String8 const& path)
{
    if (path.BeginsWith("nest/")) return &c_nestable;
    return path.BeginsWith("opt/") ? &c_recoverable : &c_plain;
}

void MemoryItem::Save(OutStream& stream, FileStoreOut& out) const
{
    stream.WriteBlock(text.GetData(), static_cast<u64>(text.GetLength()));
    for (Counted<DelayLoadHolder> const& part : parts) out.CreateFile(part);
}

bool MemoryItem::Load(InStream& stream, FileStore& store)
{
    String8 bytes;
    u64 const size = stream.GetSize();
    stream.ReadBlock(bytes.SetLength(static_cast<int>(size)), size);
    int start = bytes.Find('\n');
    text = start < 0 ? bytes : bytes.GetSubstring(0, start);
    while (start >= 0) {
        int const end = bytes.Find('\n', start + 1);
        String8 path = bytes.GetSubstring(start + 1, end < 0 ? bytes.GetLength() : end - start - 1);
        bool const isEager = path.BeginsWith("!");
        if (isEager) path = path.GetSubstring(1);
        parts.push_back(store.CreateDelayLoadHolderDirect(path, TypeOf(path), nullptr));
        JailCounted<FileStoreItem> item;
        if (isEager) eager.push_back(parts.back() && parts.back()->GetItemBase(item));
        start = end;
    }
    return !(text == "refuse");
}

bool MemoryBackData::LoadItem(FileStoreItem& item) const
{
    return LoadBytes(m_bytes, item, *MemoryFileStore::Create());
}

MemoryFileStore::~MemoryFileStore()
{
    if (!diesSuddenly) PreDestruction();
}

MemoryFileStore::Revision MemoryFileStore::Commit(char const* path, std::optional<String8> bytes, bool incremental)
{
    Counted<MemoryRevision> const revision(new MemoryRevision);
    revision->files[path] = std::move(bytes);
    revision->incremental = incremental;
    CriticalSectionScope const scope(m_lock);
    m_revisions.push_back(revision);
    return Revision(revision.Get());
}

std::optional<String8> MemoryFileStore::Find(String8 const& path, Revision revision, Counted<MemoryRevision>* at) const
{
    CriticalSectionScope const scope(m_lock);
    bool reached = !revision;
    for (auto i = m_revisions.rbegin(); i != m_revisions.rend(); ++i) {
        reached = reached || i->Get() == revision.Get();
        auto const found = (*i)->files.find(path);
        if (!reached || found == (*i)->files.end()) continue;
        if (at) *at = *i;
        return found->second;
    }
    return std::nullopt;
}

bool MemoryFileStore::LoadFile(String8 const& path, Revision revision, FileStoreItem& item, bool)
{
    ++loads;
    RunHook(onLoad);
    Counted<MemoryRevision> at;
    std::optional<String8> const bytes = Find(path, revision, &at);
    if (!bytes || !LoadBytes(*bytes, item, *this)) return false;
    SetObjectDirtyStatePostLoad(item, at->incremental ? FileStoreStateObject::DirtyStateIncremental
                                                      : FileStoreStateObject::DirtyStateClean);
    return true;
}

Counted<FileStoreBackData const> MemoryFileStore::CreateBackData(Revision revision, String8 const& path)
{
    ++copies;
    RunHook(onCreateBackData);
    std::optional<String8> const bytes = revision ? Find(path, revision) : std::nullopt;
    return bytes ? Counted<FileStoreBackData const>(new MemoryBackData(*bytes)) : nullptr;
}

MemoryFileStore::Revision MemoryFileStore::GetHeadRevisionI() const
{
    CriticalSectionScope const scope(m_lock);
    return m_revisions.empty() ? nullptr : Revision(m_revisions.back().Get());
}

MemoryFileStore::Revision MemoryFileStore::GetHeadRevisionForFileI(String8 const& path) const
{
    Counted<MemoryRevision> at;
    std::optional<String8> const bytes = Find(path, nullptr, &at);
    RunHook(onFindHead);
    return bytes ? Revision(at.Get()) : nullptr;
}

String8 TextOf(Counted<DelayLoadHolder> const& holder)
{
    JailCounted<FileStoreItem> item;
    holder->GetItemBase(item);
    return item ? CountedCast<MemoryItem>(item.GetCounted())->text : String8("(none)");
}

} // namespace KernelTest
