// Tokens, the session table and the limits on failed attempts.

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include "server/host/session.h"
#include "server/host/signin_limits.h"

namespace maru::server {
namespace {

constexpr Seconds kIdle = 600;

Claims ClaimsOf(const Session& session) {
  return {session.id, session.user, session.uid, session.expires};
}

TEST(TokenSeal, OpensItsOwnTokensOnly) {
  const TokenSeal seal, other;
  const Claims claims{"id", "al\"ice; \xff", 4'000'000'000u, 1234567};
  const std::string token = seal.Seal(claims);
  EXPECT_EQ(
      token.find_first_not_of("ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_"),
      std::string::npos);
  const auto opened = seal.Open(token);
  ASSERT_TRUE(opened);
  EXPECT_EQ(opened->session_id, claims.session_id);
  EXPECT_EQ(opened->user, claims.user);
  EXPECT_EQ(opened->uid, claims.uid);
  EXPECT_EQ(opened->expires, claims.expires);
  EXPECT_NE(seal.Seal(claims), token) << "no two tokens are alike";
  EXPECT_FALSE(other.Open(token));
}

TEST(TokenSeal, RefusesWhatWasTamperedWith) {
  const TokenSeal seal;
  const std::string token = seal.Seal({"id", "alice", 1000, 99});
  for (std::size_t i = 0; i < token.size(); ++i) {
    std::string changed = token;
    changed[i] = changed[i] == 'A' ? 'Q' : 'A';
    EXPECT_FALSE(seal.Open(changed)) << i;
    EXPECT_FALSE(seal.Open(token.substr(0, i))) << i;
  }
  EXPECT_FALSE(seal.Open(token + "A"));
  EXPECT_FALSE(seal.Open("not base64 at all!"));
}

TEST(TokenSeal, ForkedChildrenHaveNoKey) {
  const TokenSeal seal;
  const std::string token = seal.Seal({"id", "alice", 1000, 99});
  const pid_t child = fork();
  if (child == 0) _exit(seal.Open(token) ? 1 : 0);
  int status = -1;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  EXPECT_TRUE(seal.Open(token));
}

TEST(SessionTable, ASessionLastsWhileItIsUsed) {
  SessionTable table(kIdle);
  const Claims claims = ClaimsOf(table.Begin({"alice", 1000, "", false}, 0));
  Seconds now = 0;
  while (now + kIdle / 2 < SessionTable::kLifetime) {
    now += kIdle / 2;
    ASSERT_TRUE(table.Use(claims, now)) << now;
  }
  EXPECT_FALSE(table.Use(claims, SessionTable::kLifetime)) << "no session lasts for ever";

  const Claims idle = ClaimsOf(table.Begin({"alice", 1000, "", false}, 0));
  EXPECT_TRUE(table.Use(idle, kIdle - 1));
  EXPECT_FALSE(table.Use(idle, 2 * kIdle - 1));
  EXPECT_EQ(table.Count(), 0u);
}

TEST(SessionTable, WhatEndsASession) {
  SessionTable table(kIdle);
  const Session begun = table.Begin({"alice", 1000, "", false}, 0);
  EXPECT_EQ(table.Find(begun.id)->id, begun.id);
  table.End(begun.id);
  EXPECT_FALSE(table.Use(ClaimsOf(begun), 1));
  table.End(begun.id);

  Claims another_uid = ClaimsOf(table.Begin({"alice", 1000, "", false}, 0));
  another_uid.uid = 0;
  EXPECT_FALSE(table.Use(another_uid, 1));
  Claims expired = ClaimsOf(table.Begin({"alice", 1000, "", false}, 0));
  expired.expires = 1;
  EXPECT_FALSE(table.Use(expired, 1));
}

TEST(SessionTable, HoldsABoundedNumber) {
  SessionTable table(kIdle);
  const Claims oldest = ClaimsOf(table.Begin({"alice", 1000, "", false}, 0));
  const Claims second = ClaimsOf(table.Begin({"alice", 1000, "", false}, 0));
  for (std::size_t i = 2; i < SessionTable::kMaxPerUser; ++i)
    table.Begin({"alice", 1000, "", false}, 1);
  ASSERT_TRUE(table.Use(oldest, 2));
  table.Begin({"alice", 1000, "", false}, 3);
  EXPECT_TRUE(table.Use(oldest, 4)) << "it was used last";
  EXPECT_FALSE(table.Use(second, 4));
  EXPECT_EQ(table.Count(), SessionTable::kMaxPerUser);
  for (std::size_t i = 0; i < SessionTable::kMaxTotal + 10; ++i)
    table.Begin({"user" + std::to_string(i), 2000, "", false}, 5);
  EXPECT_EQ(table.Count(), SessionTable::kMaxTotal);
}

TEST(SignInLimits, OneClientGuessingOnePassword) {
  SignInLimits limits;
  for (unsigned i = 0; i < SignInLimits::kMaxPair; ++i)
    EXPECT_TRUE(limits.Admit("alice", "1.1.1.1", 0));
  EXPECT_FALSE(limits.Admit("alice", "1.1.1.1", 1));
  EXPECT_TRUE(limits.Admit("alice", "2.2.2.2", 1)) << "the owner of the account gets in elsewhere";
  EXPECT_TRUE(limits.Admit("bob", "1.1.1.1", 1));
  EXPECT_TRUE(limits.Admit("alice", "1.1.1.1", SignInLimits::kWindow));
}

TEST(SignInLimits, SuccessesDoNotCount) {
  SignInLimits limits;
  for (int i = 0; i < 1000; ++i) {
    ASSERT_TRUE(limits.Admit("alice", "1.1.1.1", 0));
    limits.Succeeded("alice", "1.1.1.1");
  }
}

TEST(SignInLimits, OneClientManyUsersAndManyClientsOneUser) {
  SignInLimits limits;
  unsigned admitted = 0;
  for (unsigned i = 0; i < 1000; ++i)
    admitted += limits.Admit("user" + std::to_string(i), "1.1.1.1", 0);
  EXPECT_EQ(admitted, SignInLimits::kMaxAddress);
  admitted = 0;
  for (unsigned i = 0; i < 1000; ++i) admitted += limits.Admit("alice", std::to_string(i), 0);
  EXPECT_EQ(admitted, SignInLimits::kMaxUser);
  EXPECT_TRUE(limits.Admit("carol", "3.3.3.3", 0));
}

TEST(SignInLimits, ForgetsInTimeAndNeverGrowsBeyondItsBound) {
  SignInLimits limits;
  std::size_t admitted = 0;
  const auto flood = [&](Seconds now) {
    admitted = 0;
    for (std::size_t i = 0; i < SignInLimits::kMaxCounters; ++i)
      admitted += limits.Admit("user" + std::to_string(i), std::to_string(i), now);
  };
  flood(0);
  EXPECT_EQ(admitted, SignInLimits::kMaxCounters / 3);
  flood(SignInLimits::kWindow);
  EXPECT_EQ(admitted, SignInLimits::kMaxCounters / 3);
}

}  // namespace
}  // namespace maru::server
