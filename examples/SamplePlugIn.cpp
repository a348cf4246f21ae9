// A plug-in's executable: serves the host that it was started for, and ends with it.
#include <cstdio>
#include <future>

#include "Extora/XTPlugInConnection.h"
#include "examples/EditingInterface.h"

int main() {
  const platform::SerialQueue queue("plug-in");
  const auto host = extora::XTPlugInConnection::initForPlugIn(queue);
  if (host == nullptr) {
    std::fputs("A plug-in is not run by hand: a host asks for it, and it is started for that host.\n", stderr);
    return 2;
  }
  // What does not fit the interface never gets here.
  host->exportInterface(editingInterface(), [](const std::string&, const platform::Array& arguments) {
    return extora::XTPlugInConnection::Answer{{"Miaow, " + arguments[0].string() + "."}, {}};
  });
  std::promise<void> hostHasGone;
  host->setEndHandler([&] { hostHasGone.set_value(); });
  host->resume();
  hostHasGone.get_future().wait();
  return 0;
}
