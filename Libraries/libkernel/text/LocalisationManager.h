#pragma once

#include "libkernel/core/String.h"

namespace Kernel {

/// Where the application's translated resources lie. Set at start, before other threads ask.
class KERNEL_API LocalisationManager
{
public:
    static LocalisationManager& GetInstance();

    /// Folder of the translated texts; empty if there are none.
    String8 const& GetLocalisedResourcesPath() const { return m_resourcesPath; }
    void SetLocalisedResourcesPath(String8 const& path) { m_resourcesPath = path; }
    /// Folder of the translated help.
    String8 const& GetLocalisedHelpPath() const { return m_helpPath; }
    void SetLocalisedHelpPath(String8 const& path) { m_helpPath = path; }

private:
    LocalisationManager() = default;

    String8 m_resourcesPath;
    String8 m_helpPath;
};

} // namespace Kernel
