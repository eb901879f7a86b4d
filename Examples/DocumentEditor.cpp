// A tiny editor of documents: pages with a title and a picture each. The pictures are loaded when somebody looks at
// them and not before, and a save writes what has changed and nothing else.
//
//     DocumentEditor FILE add TITLE PICTURE    a new page; makes the document if there is none
//     DocumentEditor FILE list
//     DocumentEditor FILE rename PAGE TITLE
//     DocumentEditor FILE show PAGE OUT        writes the page's picture to a file
//     DocumentEditor FILE undo                 shows the pages as they were before the last save

#include "libkernel/archive/Archive.h"
#include "libkernel/archive/ArchiveRevision.h"
#include "libkernel/archive/ArchiveSession.h"
#include "libkernel/core/Exception.h"
#include "libkernel/filestore/DelayLoadHolder.h"
#include "libkernel/filestore/FileStoreItem.h"
#include "libkernel/filestore/FileStoreOutPathGenerator.h"
#include "libkernel/serialisation/InSerialiserFile.h"
#include "libkernel/serialisation/OutSerialiserFile.h"
#include "libkernel/streams/InStream.h"
#include "libkernel/streams/OutStream.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

using namespace Kernel;

namespace {

constexpr IDTag c_documentKind("Page");
constexpr IDTag c_listKind("Pgls");

// A picture: an item of its own, so that it can stay in the file. ---------------------------------------------------

class Picture : public FileStoreItem
{
public:
    static FileStoreItemType const s_type;

    explicit Picture(std::string b = {}) : bytes(std::move(b)) { ++s_alive; }

    void Save(OutStream& stream, FileStoreOut&) const override
    {
        if (stream.WriteBlock(bytes.data(), bytes.size()) != bytes.size()) throw OutStream::WriteException();
    }
    bool Load(InStream& stream, FileStore&) override
    {
        bytes.resize(stream.GetSize());
        return stream.ReadBlock(bytes.data(), bytes.size()) == bytes.size();
    }
    FileStoreItemType const* GetObjectFileStoreItemType() const override { return &s_type; }

    std::string bytes;
    static int s_alive; // Pictures in memory.

private:
    ~Picture() override { --s_alive; }
};

int Picture::s_alive = 0;

Counted<FileStoreItem> CreatePicture()
{
    return MakeCounted<Picture>();
}

FileStoreItemType const Picture::s_type("Pict", &CreatePicture, FileStoreItemType::NotNestable,
                                        FileStoreItemType::NotRecoverable);
FileStoreItemType::Init const s_pictureInit(Picture::s_type);

// A page is a value inside the list of pages. ------------------------------------------------------------------------

struct Page
{
    String8 title;
    Counted<DelayLoadHolder> picture;
};

// The list of pages, which names the pictures. -----------------------------------------------------------------------

class PageList : public FileStoreItem
{
public:
    static FileStoreItemType const s_type;

    void Save(OutStream& stream, FileStoreOut& out) const override
    {
        FileStoreOutIndexedPathGenerator generator(out, "pictures/", "");
        OutSerialiserFile file(stream, out, c_listKind, 1);
        std::vector<String8> titles;
        for (Page const& page : pages) titles.push_back(page.title);
        file.SaveTypes("Titl", titles);
        for (size_t i = 0; i < pages.size(); ++i)
            file.SaveDelayLoadObject(TagOf(i), pages[i].picture, generator,
                                     MakeCounted<FileStoreCompressionHintGeneral>());
        file.Close();
    }
    bool Load(InStream& stream, FileStore& store) override
    {
        Counted<InSerialiserFile> const file = InSerialiserFile::ParseWithChecks(
            stream, store, InSerialiser::DelayLoadsBehaviour::Leave, nullptr, nullptr);
        std::vector<String8> titles;
        if (!file || file->GetFileIDTag() != c_listKind || !file->LoadTypes("Titl", titles)) return false;
        for (size_t i = 0; i < titles.size(); ++i) {
            Page page{titles[i], nullptr};
            if (!file->LoadDelayLoadObject(TagOf(i), page.picture)) return false;
            pages.push_back(page);
        }
        return true;
    }
    FileStoreItemType const* GetObjectFileStoreItemType() const override { return &s_type; }

    std::vector<Page> pages;

private:
    ~PageList() override = default;

    /// Tags of letters are for named properties; the pictures have numbers.
    static IDTag TagOf(size_t page) { return IDTag(static_cast<u32>(page) + 1); }
};

Counted<FileStoreItem> CreatePageList()
{
    return MakeCounted<PageList>();
}

// Nestable: its save hands the pictures to the store.
FileStoreItemType const PageList::s_type("Pgls", &CreatePageList, FileStoreItemType::IsNestableType,
                                         FileStoreItemType::NotRecoverable);
FileStoreItemType::Init const s_pageListInit(PageList::s_type);

// The editor. --------------------------------------------------------------------------------------------------------

class Editor
{
public:
    bool Open(String8 const& path, bool create)
    {
        Archive::OpenResult opened{};
        m_archive = Archive::Open(path, Archive::OpenModeReadWriteOrReadOnly, c_documentKind, opened);
        if (!m_archive && opened == Archive::OpenNotFound && create) {
            Archive::CreateResult created;
            m_archive = Archive::Create(path, c_documentKind, created);
        }
        if (!m_archive) {
            std::fprintf(stderr, "cannot open %s: result %d\n", path.GetData(), static_cast<int>(opened));
            return false;
        }
        return Load();
    }
    bool Undo()
    {
        m_archive->RewindWorkingRevision();
        return Load();
    }
    bool Save()
    {
        m_list->MarkAsDirty();
        ArchiveSessionHandle session;
        if (!m_archive->CreateSession(session, Archive::SessionTypeFull, nullptr)) return false;
        session->CreateFile("pages", m_list, nullptr);
        m_archive->CloseSession(session, false);
        std::vector<Counted<Archive::Revision const>> revisions;
        m_archive->GetRevisions(revisions);
        std::printf("saved revision %zu: %zu items written\n", revisions.size(), revisions.back()->GetEntries().size());
        return true;
    }
    void List() const
    {
        for (size_t i = 0; i < m_list->pages.size(); ++i)
            std::printf("%zu  %s\n", i + 1, m_list->pages[i].title.GetData());
        std::printf("%zu pages, %d pictures in memory\n", m_list->pages.size(), Picture::s_alive);
    }
    void Add(char const* title, std::string bytes)
    {
        m_list->pages.push_back(
            {title, DelayLoadHolder::Create(&Picture::s_type, MakeCounted<Picture>(std::move(bytes)))});
    }
    Page* GetPage(char const* number)
    {
        size_t const page = std::strtoul(number, nullptr, 10);
        return page >= 1 && page <= m_list->pages.size() ? &m_list->pages[page - 1] : nullptr;
    }
    /// Loads the picture for as long as it takes.
    static bool Show(Page const& page, char const* path)
    {
        DelayLoadHolder::TempLoadItem const loaded(page.picture);
        auto const* const picture = dynamic_cast<Picture const*>(loaded.GetItem().Get());
        if (!picture) return false;
        std::printf("%zu bytes, %d pictures in memory\n", picture->bytes.size(), Picture::s_alive);
        std::ofstream out(path, std::ios::binary);
        out.write(picture->bytes.data(), static_cast<std::streamsize>(picture->bytes.size()));
        return out.good();
    }

private:
    bool Load()
    {
        m_list = MakeCounted<PageList>();
        return !m_archive->HasFile("pages") || LoadAtWorkingRevision();
    }
    bool LoadAtWorkingRevision() { return m_archive->LoadFile("pages", *m_list); }

    Counted<Archive> m_archive;
    Counted<PageList> m_list;
};

int Run(int argc, char** argv)
{
    std::string const verb = argc > 2 ? argv[2] : "";
    int const arguments = argc - 3;
    bool const known = (verb == "add" && arguments == 2) || (verb == "list" && arguments == 0) ||
                       (verb == "rename" && arguments == 2) || (verb == "show" && arguments == 2) ||
                       (verb == "undo" && arguments == 0);
    if (!known) {
        std::fprintf(stderr, "Usage: DocumentEditor FILE add TITLE PICTURE | list | rename PAGE TITLE | "
                             "show PAGE OUT | undo\n");
        return 2;
    }
    Editor editor;
    if (!editor.Open(argv[1], verb == "add")) return 1;
    if (verb == "list") {
        editor.List();
        return 0;
    }
    if (verb == "undo") {
        if (!editor.Undo()) return 1;
        editor.List();
        return 0;
    }
    if (verb == "add") {
        std::ifstream in(argv[4], std::ios::binary);
        if (!in) {
            std::fprintf(stderr, "cannot read %s\n", argv[4]);
            return 1;
        }
        editor.Add(argv[3], std::string(std::istreambuf_iterator<char>(in), {}));
        return editor.Save() ? 0 : 1;
    }
    Page* const page = editor.GetPage(argv[3]);
    if (!page) {
        std::fprintf(stderr, "there is no page %s\n", argv[3]);
        return 1;
    }
    if (verb == "show") return Editor::Show(*page, argv[4]) ? 0 : 1;
    page->title = argv[4];
    return editor.Save() ? 0 : 1;
}

} // namespace

int main(int argc, char** argv)
{
    try {
        return Run(argc, argv);
    } catch (Exception const&) {
        std::fprintf(stderr, "the document could not be read or written\n");
        return 1;
    }
}
