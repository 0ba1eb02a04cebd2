#include "platform/run/Reply.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>

#include "platform/base/Log.h"

namespace platform {

namespace {
std::atomic<bool> abortOnMisuse = false;
}

void failOnReplyMisuse()
{
    abortOnMisuse = true;
}

void detail::replyMisused(const char* what)
{
    if (abortOnMisuse) {
        std::fprintf(stderr, "%s\n", what);
        std::abort();
    }
    defaultLog().fault("{}", what);
}

} // namespace platform
