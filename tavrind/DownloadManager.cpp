#include "tavrind/DownloadManager.h"

#include "CoreTavrin/TAVError.h"

namespace tavrin {

platform::Result<DownloadManager::Resource> DownloadManager::fileHandleForResource(const std::string& identifier) const
{
    return std::unexpected(makeTAVError(TAVErrorNotFound, "no resource " + identifier));
}

} // namespace tavrin
