#pragma once

#include "client/QVClient.h"
#include "client/QVClientExport.h"

// Keeps the calls of this thread together while it lives; then they leave in one write.
//
//   { QVClientBatch batch(client); client.sendMessage(...); client.sendMessage(...); }
//
// Threads: made and destroyed on the thread whose calls it keeps. Its client must outlive it.
// Batches may lie within each other; the outermost one counts.
class QV_CLIENT_API QVClientBatch {
 public:
  explicit QVClientBatch(QVClient& client);
  ~QVClientBatch();
  QVClientBatch(const QVClientBatch&) = delete;
  QVClientBatch& operator=(const QVClientBatch&) = delete;

 private:
  QVClientConnection& connection_;
};
