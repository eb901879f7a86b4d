#include "libkernel/filestore/FileStoreOut.h"

#include "libkernel/core/Exception.h"
#include "libkernel/filestore/FileStoreOutPathGenerator.h"

#include <utility>

namespace Kernel {

FileStoreOut::FileStoreOut(Purpose purpose, bool const* abort, Lifetime lifetime)
    : m_purpose(purpose), m_abort(abort), m_lifetime(lifetime)
{
}

FileStoreOut::FileStoreOut(FileStoreOut const& o, Purpose purpose)
    : m_strategies(o.m_strategies), m_purpose(purpose), m_abort(o.m_abort), m_lifetime(Lifetime::OneSave)
{
}

FileStoreOut::~FileStoreOut() = default;

void FileStoreOut::CreateFile(Counted<DelayLoadHolder> holder)
{
    CreateFile(std::move(holder), Counted<FileStoreCompressionHint>());
}

void FileStoreOut::CreateFile(String8 const& path, Counted<FileStoreItem const> const& item)
{
    CreateFile(path, item, Counted<FileStoreCompressionHint>());
}

void FileStoreOut::TestAbort() const
{
    if (IsAbortRequested()) throw AbortException();
}

void FileStoreOut::AddStrategy(Counted<SerialisationStrategy const> strategy)
{
    if (strategy) m_strategies.push_back(std::move(strategy));
}

bool FileStoreOut::AddProlongedObject(Counted<Countable const> object)
{
    if (m_lifetime == Lifetime::Process) return false;
    CriticalSectionSpinScope const scope(m_prolongedLock);
    m_prolonged.push_back(std::move(object));
    return true;
}

FileStoreOutPathGenerator::~FileStoreOutPathGenerator() = default;

FileStoreOutIndexedPathGenerator::FileStoreOutIndexedPathGenerator(FileStoreOut& out, String8 const& prefix,
                                                                   String8 const& suffix)
    : m_out(out), m_parts{prefix, suffix}
{
}

FileStoreOutIndexedPathGenerator::FileStoreOutIndexedPathGenerator(FileStoreOut& out,
                                                                   FileStoreOut::IndexedPathParts const& parts)
    : m_out(out), m_parts(parts)
{
}

FileStoreOutIndexedPathGenerator::~FileStoreOutIndexedPathGenerator() = default;

bool FileStoreOutIndexedPathGenerator::GeneratePath(NonCounted<FileStoreItem const> item,
                                                    NonCounted<DelayLoadHolder const> holder, String8& path)
{
    return m_out.GenerateIndexedPath(m_parts, item, holder, path);
}

} // namespace Kernel
