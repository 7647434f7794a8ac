#include "host/HostIdentity.h"

#include <gtest/gtest.h>

#include <set>

namespace kx {
namespace {

std::string hex(const std::array<std::uint8_t, 20>& digest) {
  std::string text;
  for (const std::uint8_t byte : digest) {
    text.push_back("0123456789abcdef"[byte >> 4]);
    text.push_back("0123456789abcdef"[byte & 0xF]);
  }
  return text;
}

TEST(HostIdentity, DigestsArePublishedOnes) {
  EXPECT_EQ(hex(sha1("")), "da39a3ee5e6b4b0d3255bfef95601890afd80709");
  EXPECT_EQ(hex(sha1("abc")), "a9993e364706816aba3e25717850c26c9cd0d89d");
  EXPECT_EQ(hex(sha1("abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq")),
            "84983e441c3bd26ebaae4aa1f95129e5e54670f1");
  EXPECT_EQ(hex(sha1(std::string(1'000'000, 'a'))), "34aa973cd4c4daa4f61eeb2bdbad27316534016f");
}

TEST(HostIdentity, VersionFiveIdentifiersArePublishedOnes) {
  const auto dns = uuidFromText("6ba7b810-9dad-11d1-80b4-00c04fd430c8");
  ASSERT_TRUE(dns.has_value());
  EXPECT_EQ(uuidText(uuidVersion5(*dns, "www.example.com")),
            "2ED6657D-E927-568B-95E1-2665A8AEA6A2");
}

TEST(HostIdentity, OnlyCanonicalTextIsAnIdentifier) {
  EXPECT_EQ(uuidText(*uuidFromText("2ed6657d-e927-568b-95e1-2665a8aea6a2")),
            "2ED6657D-E927-568B-95E1-2665A8AEA6A2");
  for (const char* text :
       {"", "x", "2ed6657de927568b95e12665a8aea6a2", "2ed6657d-e927-568b-95e1-2665a8aea6a",
        "{ed6657d-e927-568b-95e1-2665a8aea6a}", "2ed6657d-e927-568b-95e1-2665a8aea6ag",
        "2ed6657d-e927-568b-95e1-2665a8aea6a2 "})
    EXPECT_FALSE(uuidFromText(text).has_value()) << text;
}

TEST(HostIdentity, NothingSharesAnIdentifierWithSomethingElse) {
  const HostIdentity identity(HostIdentity::libraryOfFolder("/home/ada/Pictures"));
  const HostIdentity other(HostIdentity::libraryOfFolder("/home/ada/Pictures2"));
  const std::set<std::string> all{
      identity.library(),   identity.asset("a"), identity.album("a"),      identity.event("a"),
      identity.person("a"), identity.master(),   identity.asset("master"), identity.event("master"),
      other.asset("a"),     other.library()};
  EXPECT_EQ(all.size(), 10U);
  EXPECT_EQ(identity.asset("a"),
            HostIdentity(HostIdentity::libraryOfFolder("/home/ada/Pictures")).asset("a"));
}

}  // namespace
}  // namespace kx
