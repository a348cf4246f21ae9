#include "Extora/XTLog.h"
#include "xtd/RecordText.h"
#include "xtd/XTDServer.h"
#include "xtd/XTDTermination.h"

namespace extora {

void XTDServer::terminatePlugIns(const platform::PlugInRecords& records, std::function<void()> reply) {
  XTDTermination::start(*platformServices()->jobs, records, std::move(reply));
}

void XTDServer::removedPlugIns(const platform::PlugInRecords& records) {
  terminatePlugIns(records, [records] { XTLogOps().debug("removal complete for {}", describeRecords(records)); });
}

}  // namespace extora
