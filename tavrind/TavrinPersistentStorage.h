#pragma once

namespace tavrin {

struct Assembly;

/// The directory of session files. It keeps none. Any thread.
class TavrinPersistentStorage {
public:
    explicit TavrinPersistentStorage(Assembly& assembly) : _assembly(assembly) {}

private:
    [[maybe_unused]] Assembly& _assembly;
};

} // namespace tavrin
