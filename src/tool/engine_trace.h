// What the engine says about itself: silent, unless --trace asks for it.
#pragma once

namespace VELK::tool {

// Installs sinks that swallow everything.
void SilenceEngine();
// Installs sinks that print, indented, on standard error: "! report 10 line 2916 status A000011C",
// "! assert 410", and diagnostic texts.
void TraceEngine();

}  // namespace VELK::tool
