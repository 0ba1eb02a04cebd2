#include "tavrind/Restart.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <string>
#include <string_view>
#include <unistd.h>
#include <vector>

#include <systemd/sd-daemon.h>

#include "platform/base/Log.h"
#include "platform/values/Error.h"

namespace tavrin {

void startAgainWiped(int argc, char** argv, bool settings)
{
    constexpr std::string_view kOption = "--wipe=";
    std::vector<char*> arguments;
    for (int i = 0; i < argc; ++i)
        if (!std::string_view(argv[i]).starts_with(kOption)) arguments.push_back(argv[i]);
    std::string option = std::string(kOption) + (settings ? "settings" : "traces");
    arguments.push_back(option.data());
    arguments.push_back(nullptr);

    platform::defaultLog().log("starting again without {}", settings ? "traces and settings" : "traces");
    const int passed = sd_listen_fds(0); // marks them to be closed
    for (int fd = SD_LISTEN_FDS_START; fd < SD_LISTEN_FDS_START + passed; ++fd) (void)fcntl(fd, F_SETFD, 0);
    std::error_code replaced; // by an upgrade
    const auto program = std::filesystem::read_symlink("/proc/self/exe", replaced);
    if (!replaced) execv(program.c_str(), arguments.data()); // keeps the process's name
    execv("/proc/self/exe", arguments.data());
    platform::defaultLog().fault("can't start again: {}", platform::Error::posix(errno).reason());
}

} // namespace tavrin
