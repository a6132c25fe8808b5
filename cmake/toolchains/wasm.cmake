# WebAssembly by the distribution's emscripten, which finds its own JavaScript packages through NODE_PATH only; scripts/lib.sh
# sets it. Its loaders take node's experimental fetch for the browser's, which reads no files.

include(/usr/share/emscripten/cmake/Modules/Platform/Emscripten.cmake)
set(CMAKE_CROSSCOMPILING_EMULATOR node --no-experimental-fetch)
# The engine's own exceptions: without them every call that may throw goes through JavaScript.
set(CMAKE_CXX_FLAGS_INIT -fwasm-exceptions)
