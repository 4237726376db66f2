#pragma once

#include "platform/QVValue.h"

// The message with every blank in its keys replaced by "_"; values, and the keys of nested
// dictionaries, stay as they are. The message itself where no key has a blank. Of keys that become
// equal the later in order wins. Pure; any thread.
QVDictionary QVReportingNormalisedPayload(const QVDictionary& message);
