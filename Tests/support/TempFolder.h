#pragma once

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string>

namespace TestSupport {

/// A fresh folder below the system's temporary one, removed with all that lies in it when the object dies.
class TempFolder
{
public:
    TempFolder() : m_path((std::filesystem::temp_directory_path() / "kernel-test-XXXXXX").string())
    {
        if (!::mkdtemp(m_path.data())) throw std::runtime_error("no temporary folder");
    }
    ~TempFolder()
    {
        std::error_code ignored;
        std::filesystem::remove_all(m_path, ignored);
    }
    TempFolder(TempFolder const&) = delete;

    std::string const& GetPath() const { return m_path; }
    std::string operator/(std::string const& name) const { return m_path + "/" + name; }

private:
    std::string m_path;
};

/// Whole files, past the library: a missing file reads as empty.
inline std::string ReadWholeFile(std::string const& path)
{
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}
inline void WriteWholeFile(std::string const& path, std::string const& content)
{
    std::ofstream(path, std::ios::binary).write(content.data(), static_cast<std::streamsize>(content.size()));
}

} // namespace TestSupport
