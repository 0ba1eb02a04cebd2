#pragma once

#include <functional>
#include <memory>
#include <string>

namespace tavrin {
struct TAVSearchRequest;
}

namespace tavrin::ctl {

struct Options;

/// Searches with every key that is typed into the terminal, beginning with `text`, until Ctrl-C or Ctrl-D. `request`
/// makes the request for a text.
void searchInteractively(const Options& options, const std::string& text,
                         const std::function<std::shared_ptr<TAVSearchRequest>(const std::string&)>& request);

} // namespace tavrin::ctl
