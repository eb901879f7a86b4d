#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <iterator>
#include <ostream>
#include <string>
#include <vector>

// Each target of the fuzzer is compiled into this program under a name of its own, by a list made from the sources.
#define KERNEL_FUZZ_TARGET(name) extern "C" int FuzzTarget_##name(uint8_t const* data, size_t size);
#include "FuzzTargetList.inc"
#undef KERNEL_FUZZ_TARGET

// The mutators of some targets ask the fuzzer's own. Nothing is mutated here.
extern "C" size_t LLVMFuzzerMutate(uint8_t*, size_t size, size_t);
extern "C" size_t LLVMFuzzerMutate(uint8_t*, size_t size, size_t)
{
    return size;
}

namespace {

// Printed by its name, for lists of tests.
struct Target
{
    friend void PrintTo(Target const& target, std::ostream* out) { *out << target.name; }

    char const* name;
    int (*run)(uint8_t const* data, size_t size);
};

constexpr Target c_targets[] = {
#define KERNEL_FUZZ_TARGET(name) {#name, &FuzzTarget_##name},
#include "FuzzTargetList.inc"
#undef KERNEL_FUZZ_TARGET
};

class FuzzReplay : public testing::TestWithParam<Target>
{
};

std::string NameOf(testing::TestParamInfo<Target> const& info)
{
    return info.param.name;
}

} // namespace

TEST_P(FuzzReplay, EveryInputOfTheCorpusPasses)
{
    std::filesystem::path const folder = std::filesystem::path(KERNEL_SOURCE_DIR "/Fuzz/corpus") / GetParam().name;
    std::vector<std::filesystem::path> files;
    if (is_directory(folder))
        for (auto const& entry : std::filesystem::directory_iterator(folder)) files.push_back(entry.path());
    std::sort(files.begin(), files.end());
    EXPECT_FALSE(files.empty()) << "no corpus in " << folder;

    for (auto const& file : files) {
        SCOPED_TRACE(file.filename().string());
        std::ifstream in(file, std::ios::binary);
        // An allocation of the exact size, so that a sanitiser sees the first byte beyond.
        std::vector<char> const bytes{std::istreambuf_iterator<char>(in), {}};
        EXPECT_NO_THROW(GetParam().run(reinterpret_cast<uint8_t const*>(bytes.data()), bytes.size()));
    }
    EXPECT_NO_THROW(GetParam().run(nullptr, 0));
}

INSTANTIATE_TEST_SUITE_P(Corpus, FuzzReplay, testing::ValuesIn(c_targets), NameOf);
