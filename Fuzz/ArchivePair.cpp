#include "ArchiveChecks.h"
#include "ArchiveRepair.h"

namespace {

// Where the scratch file begins: behind as many bytes as the first two say.
size_t SizeOfMaster(uint8_t const* data, size_t size)
{
    return size < 2 ? 0 : std::min<size_t>(data[0] | data[1] << 8, size - 2);
}

} // namespace

// The size of the master in two bytes, the master, the scratch file.
extern "C" int LLVMFuzzerTestOneInput(uint8_t const* data, size_t size)
{
    using namespace Kernel;
    using namespace Kernel::Fuzz;
    if (size < 2) return 0;
    LonelyDisk disk;
    size_t const masterSize = SizeOfMaster(data, size);
    MemoryDisk::Image const image = {{c_masterPath, Content(data + 2, masterSize)},
                                     {c_scratchPath, Content(data + 2 + masterSize, size - 2 - masterSize)}};
    // Recovery reads a master whose guard is damaged. A save into the scratch file leaves that as it is, so that the
    // verification reports it and only recovery opens the pair again.
    bool const isSound = TestBytes(*image.at(c_masterPath)) != Archive::OpenBadInfo;
    for (Opener const opener : {Opener(Archive::Open), Opener(Archive::RecoverArchive)}) {
        disk->Load(image);
        Open result{};
        Counted<Archive> archive = OpenBy(opener, c_scratchPath, result);
        if (!archive) {
            Require(disk->GetImage().size() == 2 && *disk->GetImage().at(c_scratchPath) == *image.at(c_scratchPath) &&
                        *disk->GetImage().at(c_masterPath) == *image.at(c_masterPath),
                    "what does not open stays as it is");
            continue;
        }
        bool const isPair = archive->HasScratchFile() && archive->MainFileHasPath() && !archive->IsJustScratchFile();
        Items items = ReadAll(*archive);
        LookAround(*archive);
        Changes const first = {{"first", "scratch"}};
        Changes const second = {{"first", std::nullopt}, {"second", "master"}};
        bool saved =
            isPair && Save(*archive, first, true, Archive::SessionTypeFull, false, isSound) == SaveOutcome::Saved;
        if (saved) {
            items = Applied(items, first);
            archive = nullptr;
            archive = OpenBy(isSound ? Opener(Archive::Open) : opener, c_scratchPath, result);
            Require(archive && AreSame(ReadAll(*archive), items), "a save into the scratch file comes back");
        }
        // The master takes what the scratch file holds with it; what can't be read can't be taken.
        saved = Save(*archive, second, archive->IsJustScratchFile()) == SaveOutcome::Saved;
        if (saved) {
            items = Applied(items, second);
            archive = nullptr;
            archive = OpenBy(Archive::Open, c_scratchPath, result);
            Require(archive && AreSame(ReadAll(*archive), items), "a save into the master comes back");
            archive = nullptr;
            if (isPair) {
                archive = OpenBy(Archive::Open, c_masterPath, result);
                Require(archive && AreSame(ReadAll(*archive), items), "and the master alone has it");
            }
        }
        archive = nullptr;
        Require(disk->GetOpenHandles() == 0, "no handle is left");
    }
    return 0;
}

// Three times of four the link fits the master again.
extern "C" size_t LLVMFuzzerCustomMutator(uint8_t* data, size_t size, size_t maxSize, unsigned seed)
{
    size = LLVMFuzzerMutate(data, size, maxSize);
    if (seed % 4 == 0 || size < 2) return size;
    size_t const masterSize = SizeOfMaster(data, size);
    uint8_t* const master = data + 2;
    uint8_t* const scratch = master + masterSize;
    size_t const scratchSize = size - 2 - masterSize;
    Kernel::Fuzz::ArchiveRepair(master, masterSize).Repair();
    Kernel::Fuzz::ArchiveRepair(scratch, scratchSize).Repair();
    if (masterSize < 72 || scratchSize < 100) return size;
    std::memcpy(scratch + 72, master + 48, 12); // Time and count of the master's last save.
    if (seed % 8 < 6 && seed % 16 < 14) {
        scratch[6] |= 1;
        std::memcpy(scratch + 84, "\x08\x00/ram/doc", 10);
    }
    return size;
}
