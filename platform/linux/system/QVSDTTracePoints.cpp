#include "platform/linux/system/QVSDTTracePoints.h"

#include <sys/sdt.h>

void QVSDTTracePoints::trace(uint32_t code, uint64_t first, uint64_t second, uint64_t third,
                             uint64_t fourth) {
  STAP_PROBE5(quietvox, trace, code, first, second, third, fourth);
}
