#include "ArchiveChecks.h"
#include "ArchiveRepair.h"

// A document, opened by searching it.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    using namespace Kernel;
    using namespace Kernel::Fuzz;
    LonelyDisk disk;
    auto const bytes = Content(data, size);
    disk->Load({{c_masterPath, bytes}});
    Open result{};
    std::optional<Items> opened;
    if (Counted<Archive> const archive = OpenBy(Archive::Open, c_masterPath, result)) opened = ReadAll(*archive);
    Open recovery{};
    Counted<Archive> archive = OpenBy(Archive::RecoverArchive, c_masterPath, recovery);
    bool const isForRecovery = result >= Archive::OpenCorrupt && result <= Archive::OpenTruncated;
    if (opened)
        Require(archive && ReadAll(*archive) == *opened, "a sound file gives what opening gives");
    else
        Require(isForRecovery || result == recovery, "what recovery is not for it does not change");
    Require(*disk->GetImage().at(c_masterPath) == *bytes, "recovery writes nothing");
    if (archive) CheckArchive(std::move(archive), c_masterPath);
    Require(disk->GetOpenHandles() == 0, "no handle is left");
    return 0;
}

// Half of the repaired ones lose their info block.
extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed)
{
    size = LLVMFuzzerMutate(data, size, maxSize);
    if (seed % 4 == 0) return size;
    Kernel::Fuzz::ArchiveRepair(data, size).Repair();
    if (seed % 8 >= 4 && size >= 32) std::memset(data + 16, static_cast<int>(seed >> 8), 8);
    return size;
}
