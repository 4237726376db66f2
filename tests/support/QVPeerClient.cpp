#include "tests/support/QVPeerClient.h"

#include <gtest/gtest.h>

namespace {

void expectYes(const QVPeerMessage& reply) {
  EXPECT_TRUE(reply.boolean());
}

void expectNoError(const QVPeerMessage& reply) {
  EXPECT_TRUE(reply.isReturn()) << reply.description();
  EXPECT_EQ(reply.signature, "");
}

}  // namespace

void QVPeerClient::create(int64_t reporterID) {
  expectYes(call(createCall(reporterID)));
}

void QVPeerClient::create(int64_t reporterID, uint16_t serviceType) {
  create(reporterID);
  setServiceType(serviceType, reporterID);
}

void QVPeerClient::setServiceType(uint16_t serviceType, int64_t reporterID) {
  expectYes(call(setServiceTypeCall(serviceType, reporterID)));
}

uint16_t QVPeerClient::serviceType(int64_t reporterID) {
  return call(getServiceTypeCall(reporterID)).unsigned16();
}

void QVPeerClient::configure(const QVDictionary& configuration, int64_t reporterID) {
  expectYes(call(configureCall(configuration, reporterID)));
}

uint32_t QVPeerClient::start(int64_t reporterID) {
  const uint32_t serial = post(startCall(reporterID));
  awaitOperations();
  return serial;
}

void QVPeerClient::sendMessage(const QVDictionary& message, const std::vector<int64_t>& reporterIDs,
                               uint32_t category, uint16_t type) {
  expectNoError(call(sendCall(message, reporterIDs, category, type)));
}

void QVPeerClient::sendToAll(const QVDictionary& message, uint32_t category, uint16_t type) {
  expectNoError(call(sendToAllCall(message, category, type)));
}

void QVPeerClient::stop(int64_t reporterID) {
  expectYes(call(stopCall(reporterID)));
}

void QVPeerClient::destroy(int64_t reporterID) {
  expectYes(call(destroyCall(reporterID)));
}

bool QVPeerClient::isValid(int64_t reporterID) {
  const QVDictionary answer = call(validateCall(reporterID)).dictionary();
  const QVValue* valid = answer.find("reporterID");
  return valid != nullptr && *valid == QVValue(reporterID);
}

std::vector<int64_t> QVPeerClient::reporters() {
  return call(listCall()).integers();
}

// Operations run one after the other, whichever client asked for them.
void QVPeerClient::awaitOperations() {
  reporters();
}
