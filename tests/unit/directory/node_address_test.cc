#include "platform/directory/node_address.h"

#include <gtest/gtest.h>

namespace kolt {
namespace {

TEST(NodeAddressTest, ParsesEveryNameForm) {
  auto url = parseNodeName("/LDAPv3/ldap://ds.example.com:1389");
  ASSERT_TRUE(url);
  EXPECT_EQ(url->scheme, LdapScheme::kLdap);
  EXPECT_EQ(url->host, "ds.example.com");
  EXPECT_EQ(url->port, 1389);
  EXPECT_EQ(url->url, "ldap://ds.example.com:1389");

  auto bare = parseNodeName("/LDAPv3/10.0.0.5");
  ASSERT_TRUE(bare);
  EXPECT_EQ(bare->scheme, LdapScheme::kLdap);
  EXPECT_EQ(bare->port, 389);
  EXPECT_EQ(bare->url, "ldap://10.0.0.5");

  auto secure = parseNodeName("/LDAPv3/LDAPS://[fe80::1]/");
  ASSERT_TRUE(secure);
  EXPECT_EQ(secure->scheme, LdapScheme::kLdaps);
  EXPECT_EQ(secure->host, "fe80::1");
  EXPECT_EQ(secure->port, 636);
  EXPECT_EQ(connectionUrl(*secure, ""), "ldaps://[fe80::1]:636");

  auto local = parseNodeName("/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi");
  ASSERT_TRUE(local);
  EXPECT_EQ(local->scheme, LdapScheme::kLdapi);
  EXPECT_EQ(local->socketPath, "/var/run/ldapi");
  EXPECT_EQ(connectionUrl(*local, "/tmp/sand box/var/run/ldapi"),
            "ldapi://%2Ftmp%2Fsand%20box%2Fvar%2Frun%2Fldapi");
  EXPECT_EQ(parseNodeName("/LDAPv3/ldapi://")->socketPath, kDefaultLdapiSocket);
}

TEST(NodeAddressTest, RefusesWhatIsNoServer) {
  for (const char* name :
       {"", "/LDAPv3/", "LDAPv3/ldap://h", "/Local/Default", "/LDAPv3/ldap://", "/LDAPv3/:389",
        "/LDAPv3/ldap://h/dc=x", "/LDAPv3/ldap://h?uid", "/LDAPv3/ldap://u@h", "/LDAPv3/h:0",
        "/LDAPv3/h:65536", "/LDAPv3/h:1x", "/LDAPv3/h:", "/LDAPv3/ftp://h", "/LDAPv3/[::1",
        "/LDAPv3/ldapi://tmp%2Fx", "/LDAPv3/ldapi://%2Fa%2", "/LDAPv3/ldapi://%2Fa%00b",
        "/LDAPv3/ldap://h h"}) {
    EXPECT_FALSE(parseNodeName(name)) << name;
  }
}

TEST(NodeAddressTest, StartTlsIsRequiredExactlyForPlainLdapToAnotherHost) {
  auto rule = [](const char* name) { return startTlsRequiredBeforeBind(*parseNodeName(name)); };
  EXPECT_TRUE(rule("/LDAPv3/ldap://10.1.2.3"));
  EXPECT_TRUE(rule("/LDAPv3/ds.example.com"));
  EXPECT_TRUE(rule("/LDAPv3/ldap://[fe80::1]:389"));
  EXPECT_TRUE(rule("/LDAPv3/ldap://localhost.example.com"));
  EXPECT_TRUE(rule("/LDAPv3/ldap://128.0.0.1"));
  EXPECT_FALSE(rule("/LDAPv3/ldap://127.0.0.1:1389"));
  EXPECT_FALSE(rule("/LDAPv3/127.5.6.7"));
  EXPECT_FALSE(rule("/LDAPv3/LocalHost"));
  EXPECT_FALSE(rule("/LDAPv3/ldap://[::1]"));
  EXPECT_FALSE(rule("/LDAPv3/ldap://[::ffff:127.0.0.1]"));
  EXPECT_FALSE(rule("/LDAPv3/ldaps://10.1.2.3"));
  EXPECT_FALSE(rule("/LDAPv3/ldapi://%2Fvar%2Frun%2Fldapi"));
}

TEST(NodeAddressTest, ServerKeysIgnoreTheHostsCase) {
  EXPECT_EQ(serverKey(*parseNodeName("/LDAPv3/DS.Example.com")),
            serverKey(*parseNodeName("/LDAPv3/ldap://ds.example.com:389")));
  EXPECT_NE(serverKey(*parseNodeName("/LDAPv3/ldap://h")),
            serverKey(*parseNodeName("/LDAPv3/ldaps://h")));
}

}  // namespace
}  // namespace kolt
