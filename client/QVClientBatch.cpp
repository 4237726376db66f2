#include "client/QVClientBatch.h"

#include "client/QVClientConnection.h"

QVClientBatch::QVClientBatch(QVClient& client) : connection_(*client.connection_) {
  connection_.beginBatch();
}

QVClientBatch::~QVClientBatch() {
  connection_.endBatch();
}
