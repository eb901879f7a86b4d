#pragma once

#include <string>

namespace TestSupport {

/// A fresh folder below the system's temporary one, removed with all that lies in it when the object dies.
class TempFolder
{
public:
    TempFolder();
    ~TempFolder();
    TempFolder(TempFolder const&) = delete;
    TempFolder& operator=(TempFolder const&) = delete;

    std::string const& GetPath() const { return m_path; }
    std::string operator/(std::string const& name) const { return m_path + "/" + name; }

private:
    std::string m_path;
};

/// Whole files, past the library: a missing file reads as empty.
std::string ReadWholeFile(std::string const& path);
void WriteWholeFile(std::string const& path, std::string const& content);

} // namespace TestSupport
