// The controller tables, the revision string and secret redaction.
#include "kolt/controller_helpers.h"

#include <gtest/gtest.h>

#include "kolt/log.h"
#include "volumes/controller_host_map.h"

namespace kolt {
namespace {

Value controller(const char* address, const char* hostName) {
  Dictionary d;
  if (address) d.set("IPAddress", address);
  if (hostName) d.set("hostName", hostName);
  return Value(std::move(d));
}

Value computer(const char* uuid, std::initializer_list<const char*> addresses,
               const char* hostName) {
  Dictionary d;
  d.set("uuid", uuid);
  Array list;
  for (const char* a : addresses) list.emplace_back(a);
  d.set("ipAddresses", Value(std::move(list)));
  if (hostName) d.set("legacyHostName", hostName);
  return Value(std::move(d));
}

Array strings(std::initializer_list<const char*> items) {
  Array a;
  for (const char* s : items) a.emplace_back(s);
  return a;
}

TEST(MachineIPMap, MapsEveryAddressToItsControllerLaterEntriesWinning) {
  EXPECT_TRUE(calculateMachineIPMap(Value(Dictionary())).empty());
  EXPECT_TRUE(calculateMachineIPMap(Value("not a table")).empty());
  Dictionary controllers;
  controllers.set("AAAA", controller("10.0.0.1", "a"));
  controllers.set("BBBB", controller("10.0.0.2", "b"));
  controllers.set("CCCC", controller("10.0.0.1", "c"));  // shares A's address
  controllers.set("DDDD", controller(nullptr, "d"));     // no address: passed over
  const Dictionary map = calculateMachineIPMap(Value(controllers));
  ASSERT_EQ(map.size(), 2u);
  EXPECT_EQ(*map.find("10.0.0.1"), Value("CCCC"));
  EXPECT_EQ(*map.find("10.0.0.2"), Value("BBBB"));
}

TEST(ControllerHostMap, BuildsAddressToHostName) {
  Dictionary map;
  addControllerToIPMap(controller("10.0.0.1", "first"), &map);
  addControllerToIPMap(controller("10.0.0.2", "second"), &map);
  addControllerToIPMap(controller("10.0.0.1", "replaced"), &map);
  addControllerToIPMap(controller(nullptr, "no-address"), &map);
  EXPECT_EQ(*map.find("10.0.0.1"), Value("replaced"));
  addControllerToIPMap(controller("10.0.0.2", nullptr), &map);  // no host name: no mapping
  EXPECT_EQ(map.find("10.0.0.2"), nullptr);
  EXPECT_EQ(map.size(), 1u);
}

TEST(MigrateComputers, KeepsComputersAtNameServerAddresses) {
  Array computers;
  computers.push_back(computer("U1", {"10.0.0.1", "192.168.1.1", "10.0.0.2"}, "one"));
  computers.push_back(computer("U2", {"172.16.0.1"}, "two"));  // no name server
  computers.push_back(computer("U3", {"10.0.0.3"}, "three"));  // an alias
  computers.push_back(computer("U4", {"10.0.0.4"}, nullptr));  // no host name
  const Array nameServers = strings({"10.0.0.1", "10.0.0.2", "10.0.0.3", "10.0.0.4"});
  const Array aliases = strings({"U3"});
  const Dictionary result = migrateComputersToControllers(Value(computers), nameServers, &aliases);
  ASSERT_EQ(result.size(), 1u);
  EXPECT_EQ(*result.find("U1"), controller("10.0.0.2", "one"));  // the later match

  // Without aliases U3 is kept; a dictionary of computers counts its values.
  Dictionary byKey;
  byKey.set("x", computer("U3", {"10.0.0.3"}, "three"));
  const Dictionary fromDict = migrateComputersToControllers(Value(byKey), nameServers, nullptr);
  ASSERT_EQ(fromDict.size(), 1u);
  EXPECT_EQ(*fromDict.find("U3"), controller("10.0.0.3", "three"));
}

TEST(RedactSecrets, HidesBothSecretsWithoutTouchingTheDocument) {
  const std::string secret = "s3cret-Shared-Key";
  Value document;
  document.set("sanName", "SAN");
  document.set("sharedSecret", secret);
  Value globals;
  globals.set("sharedSecret", secret);
  globals.set("revision", "R");
  document.set("globals", globals);
  const Value original = document;

  const Value redacted = redactVornSecrets(document);
  EXPECT_EQ(document, original);
  EXPECT_EQ(*redacted.findString("sharedSecret"), "********");
  EXPECT_EQ(*redacted.find("globals")->findString("sharedSecret"), "********");
  EXPECT_EQ(*redacted.find("globals")->findString("revision"), "R");
  EXPECT_EQ(*redacted.findString("sanName"), "SAN");
  // Neither its printed form nor a log line built from it holds the secret.
  EXPECT_EQ(redacted.description().find(secret), std::string::npos);
  EXPECT_EQ(formatMessage("config %@", {FormatArg(redacted)}).find(secret), std::string::npos);
}

TEST(RedactSecrets, LeavesDocumentsWithoutSecretsEqual) {
  Value document;
  document.set("sanName", "SAN");
  document.set("globals", Value(Dictionary()));
  EXPECT_EQ(redactVornSecrets(document), document);
  EXPECT_EQ(redactVornSecrets(Value("text")), Value("text"));
}

}  // namespace
}  // namespace kolt
