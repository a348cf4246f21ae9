// The interface between a host and an editing plug-in: what the one may ask of the other, and in which words.
#pragma once

#include "Extora/XTInterface.h"

/// "apply": a text, and what the plug-in makes of it.
inline std::shared_ptr<platform::InterfaceDescription> editingInterface() {
  static const auto interface =
      extora::defineInterface("com.example.editing", {{"apply", "request:0:{String},reply:0:{String}"}});
  return interface;
}
