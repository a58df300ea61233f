// Where sd-bus is not there to compare with.
#include "benchmarks/ipc/Subject.h"

namespace vela::ipcbench {

Subject sdBusSubject() { return {"(b) sd-bus", nullptr}; }

} // namespace vela::ipcbench
