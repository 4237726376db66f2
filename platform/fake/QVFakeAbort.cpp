#include "platform/fake/QVFakeAbort.h"

#include <cstdlib>
#include <iostream>

void QVFakeAbort(const std::string& message) {
  std::cerr << message << '\n' << std::flush;
  std::abort();
}
