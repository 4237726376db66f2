#pragma once

#include <string>

// The value of an environment variable; empty where there is none. While there is one thread.
std::string QVEnvironment(const char* name);
