#include "ArchiveChecks.h"
#include "ArchiveRepair.h"

// A document, opened as it is.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    using namespace Kernel;
    using namespace Kernel::Fuzz;
    LonelyDisk disk;
    auto const bytes = Content(data, size);
    Open const tested = TestBytes(*bytes);
    disk->Load({{c_masterPath, bytes}});
    Open result{};
    Counted<Archive> archive = OpenBy(Archive::Open, c_masterPath, result);
    // A test that needs no archive looks neither for the file of a link nor at the newest table's body.
    bool const isStructure = result >= Archive::OpenNotArchive && result <= Archive::OpenTruncated;
    Require(tested == Archive::OpenOk ? !isStructure || result == Archive::OpenCorrupt : !archive,
            "the test and opening agree");
    if (archive) {
        CheckArchive(std::move(archive), c_masterPath);
    } else {
        Require(*disk->GetImage().at(c_masterPath) == *bytes, "what does not open stays as it is");
    }
    Archive::LinkInfo link;
    Archive::TestForScratchLinkAndReferenceInfo(Str(c_masterPath), true, link);
    Archive::VerifyLinks(Str(c_masterPath));
    Require(disk->GetOpenHandles() == 0, "no handle is left");
    return 0;
}

extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed)
{
    size = LLVMFuzzerMutate(data, size, maxSize);
    if (seed % 4 != 0) Kernel::Fuzz::ArchiveRepair(data, size).Repair();
    return size;
}
