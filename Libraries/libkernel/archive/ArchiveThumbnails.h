#pragma once

#include "libkernel/core/Countable.h"
#include "libkernel/core/IDTag.h"
#include "libkernel/core/RawData.h"
#include "libkernel/serialisation/Serialisable.h"

#include <vector>

namespace Kernel {

/// Small pictures that lie beside a document's data, outside its history. Written by one thread, then only read.
class KERNEL_API ArchiveThumbnails : public Serialisable
{
public:
    enum class FileType
    {
        Picture = 0 ///< The one kind there is; the bytes say what they are.
    };

    /// One picture. Saved as an inline class.
    struct KERNEL_API Rec
    {
        FileType type = FileType::Picture;
        Counted<RawData> data; ///< Never null once read or added.

        static ClassUID GetClassUID() { return ClassUID("artc"); }
        static u16 GetSchemaVersion() { return 1; }
        void Save(OutSerialiser& out) const;
        /// Replaces the data. Good only when both properties are there.
        bool Load(InSerialiser const& in, ClassUID const& uid, u16 version);
    };

    ArchiveThumbnails();

    /// Appends a picture; a null @p data is ignored.
    void AddFile(FileType type, Counted<RawData> const& data);
    std::vector<Rec> const& GetRecs() const { return m_recs; }

    void Save(OutSerialiser& out) const override;
    bool Load(InSerialiser const& in, FileStore& store, u16 version) override;
    ClassProperties const* GetObjectClassProperties() const override;

private:
    ~ArchiveThumbnails() override;

    std::vector<Rec> m_recs;
};

} // namespace Kernel
