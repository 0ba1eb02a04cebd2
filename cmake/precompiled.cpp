// Compiled for its precompiled headers; see Layers.cmake.
