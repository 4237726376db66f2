#include "fuzz/QVFuzzBusFrames.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size) {
  QVFuzzBusFrames({reinterpret_cast<const char*>(data), size});
  return 0;
}
