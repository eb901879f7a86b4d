#pragma once

#include "libkernel/core/String.h"
#include "support/TempFolder.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <string>

namespace TestSupport {

inline Kernel::String8 S(std::string const& text)
{
    return Kernel::String8{std::string_view(text)};
}

/// A test with a folder of its own, and the path of a file in it.
class FileFixture : public testing::Test
{
protected:
    Kernel::String8 At(std::string const& name) const { return S(m_folder / name); }
    Kernel::String8 Make(std::string const& name, std::string const& content = "content") const
    {
        WriteWholeFile(m_folder / name, content);
        return At(name);
    }
    Kernel::String8 MakeFolder(std::string const& name) const
    {
        std::filesystem::create_directories(m_folder / name);
        return At(name);
    }
    Kernel::String8 MakeLink(std::string const& name, std::string const& target) const
    {
        std::filesystem::create_symlink(target, m_folder / name);
        return At(name);
    }

    TempFolder m_folder;
    std::string const m_path = m_folder / "file";
};

} // namespace TestSupport
