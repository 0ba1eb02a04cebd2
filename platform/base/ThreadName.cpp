#include "platform/base/ThreadName.h"

#include <pthread.h>
#include <string>

namespace platform {

void setThreadNameForLabel(std::string_view label)
{
    static thread_local std::string name;
    label.remove_prefix(label.find_last_of('.') + 1);
    label = label.substr(0, 15);
    if (name == label) return;
    name = label;
    pthread_setname_np(pthread_self(), name.c_str());
}

} // namespace platform
