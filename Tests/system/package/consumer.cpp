#include <cstdio>
#include <libkernel/libkernel.h>

using namespace Kernel;

/// Text that a document keeps under a path.
class Note : public FileStoreItem
{
public:
    static FileStoreItemType const c_type;
    explicit Note(String8 t) : text(std::move(t)) {}

    void Save(OutStream& out, FileStoreOut&) const override { out.WriteBlock(text.GetData(), text.GetLength()); }
    bool Load(InStream& in, FileStore&) override
    {
        int const size = static_cast<int>(in.GetSize());
        return in.ReadBlock(text.SetLength(size), size) == static_cast<u64>(size);
    }
    FileStoreItemType const* GetObjectFileStoreItemType() const override { return &c_type; }

    String8 text;
};

FileStoreItemType const Note::c_type(
    "Note", [] { return Counted<FileStoreItem>(new Note("")); }, FileStoreItemType::NotNestable,
    FileStoreItemType::NotRecoverable);

int main(int, char** arguments)
{
    String8 const path = arguments[1];
    Archive::CreateResult created;
    if (Counted<Archive> const document = Archive::Create(path, "Demo", created)) {
        ArchiveSessionHandle session;
        document->CreateSession(session, Archive::SessionTypeFull, nullptr);
        session->CreateFile("notes/first", MakeCounted<Note>("Spring tide at noon."));
        document->CloseSession(session, true); // On the device when it returns, or it throws.
    }

    Archive::OpenResult opened;
    Counted<Archive> const document = Archive::Open(path, Archive::OpenModeReadOnly, "Demo", opened);
    Note note("");
    if (!document || !document->LoadFile("notes/first", note)) return 1;
    std::puts(note.text.GetData());
}
