#pragma once

namespace tavrin {

struct Assembly;

/// Installs lookup hints in the device's data-detector store. There are none to install. Any thread.
class Lookup {
public:
    explicit Lookup(Assembly& assembly) : _assembly(assembly) {}

private:
    [[maybe_unused]] Assembly& _assembly;
};

} // namespace tavrin
