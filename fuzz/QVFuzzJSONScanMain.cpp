#include "fuzz/QVFuzzFiles.h"

#include <cstdint>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size) {
  QVFuzzJSONScan({reinterpret_cast<const char*>(data), size});
  return 0;
}
