#include "server/host/session.h"

#include <sodium.h>
#include <sys/mman.h>

#include <algorithm>
#include <limits>
#include <stdexcept>

#include "server/wire/fields.h"

namespace maru::server {
namespace {

constexpr std::size_t kPage = 4096;
constexpr std::size_t kIdBytes = 16;
constexpr int kTokenVariant = sodium_base64_VARIANT_URLSAFE_NO_PADDING;

std::string RandomId() {
  unsigned char bytes[kIdBytes];
  randombytes_buf(bytes, sizeof(bytes));
  char text[2 * kIdBytes + 1];
  sodium_bin2hex(text, sizeof(text), bytes, sizeof(bytes));
  return text;
}

unsigned char* Bytes(std::string& text) {
  return reinterpret_cast<unsigned char*>(text.data());
}
const unsigned char* Bytes(const std::string& text) {
  return reinterpret_cast<const unsigned char*>(text.data());
}

}  // namespace

void TokenSeal::Unmap::operator()(unsigned char* key) const {
  sodium_memzero(key, kPage);
  munmap(key, kPage);
}

TokenSeal::TokenSeal() {
  if (sodium_init() < 0) throw std::runtime_error("libsodium cannot start");
  void* page = mmap(nullptr, kPage, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (page == MAP_FAILED) throw std::runtime_error("no memory for the key of the session tokens");
  key_.reset(static_cast<unsigned char*>(page));
  if (madvise(page, kPage, MADV_WIPEONFORK) < 0 || madvise(page, kPage, MADV_DONTDUMP) < 0)
    throw std::runtime_error("the key of the session tokens cannot be kept from children");
  crypto_secretbox_keygen(key_.get());
}

std::string TokenSeal::Seal(const Claims& claims) const {
  const std::string plain = PackFields(
      {claims.session_id, claims.user, std::to_string(claims.uid), std::to_string(claims.expires)});
  std::string sealed(crypto_secretbox_NONCEBYTES + crypto_secretbox_MACBYTES + plain.size(), '\0');
  randombytes_buf(sealed.data(), crypto_secretbox_NONCEBYTES);
  crypto_secretbox_easy(Bytes(sealed) + crypto_secretbox_NONCEBYTES, Bytes(plain), plain.size(),
                        Bytes(sealed), key_.get());
  std::string token(sodium_base64_encoded_len(sealed.size(), kTokenVariant), '\0');
  sodium_bin2base64(token.data(), token.size(), Bytes(sealed), sealed.size(), kTokenVariant);
  token.pop_back();  // the terminating zero
  return token;
}

std::optional<Claims> TokenSeal::Open(std::string_view token) const {
  std::string sealed(token.size(), '\0');
  std::size_t size = 0;
  const char* end = nullptr;
  if (sodium_base642bin(Bytes(sealed), sealed.size(), token.data(), token.size(), nullptr, &size,
                        &end, kTokenVariant) != 0 ||
      end != token.data() + token.size())
    return std::nullopt;
  constexpr std::size_t kOverhead = crypto_secretbox_NONCEBYTES + crypto_secretbox_MACBYTES;
  if (size < kOverhead) return std::nullopt;
  std::string plain(size - kOverhead, '\0');
  if (crypto_secretbox_open_easy(Bytes(plain), Bytes(sealed) + crypto_secretbox_NONCEBYTES,
                                 size - crypto_secretbox_NONCEBYTES, Bytes(sealed),
                                 key_.get()) != 0)
    return std::nullopt;
  const auto fields = UnpackFields<4>(plain);
  if (!fields) return std::nullopt;
  const auto& [session_id, user, uid_text, expires_text] = *fields;
  const auto uid = ParseNumber(uid_text, std::numeric_limits<uid_t>::max());
  const auto expires = ParseNumber(expires_text, std::numeric_limits<Seconds>::max());
  if (!uid || !expires) return std::nullopt;
  return Claims{std::string(session_id), std::string(user), static_cast<uid_t>(*uid),
                static_cast<Seconds>(*expires)};
}

const Session& SessionTable::Begin(const User& user, Seconds now) {
  MakeRoom(user.name);
  const Seconds expires = now + std::max(kLifetime, idle_limit_);
  Session session{RandomId(), user.name, user.uid, user.stamp, expires, now, now, 0};
  const std::string id = session.id;
  return sessions_[id] = std::move(session);
}

void SessionTable::MakeRoom(const std::string& user) {
  const auto older = [](const auto& a, const auto& b) {
    return a.second.last_used < b.second.last_used;
  };
  if (sessions_.size() >= kMaxTotal)
    sessions_.erase(std::min_element(sessions_.begin(), sessions_.end(), older));
  std::size_t count = 0;
  auto oldest = sessions_.end();
  for (auto it = sessions_.begin(); it != sessions_.end(); ++it) {
    if (it->second.user != user) continue;
    ++count;
    if (oldest == sessions_.end() || older(*it, *oldest)) oldest = it;
  }
  if (count >= kMaxPerUser) sessions_.erase(oldest);
}

bool SessionTable::IsOver(const Session& session, Seconds now) const {
  return now >= session.expires || now - session.last_used >= idle_limit_;
}

Session* SessionTable::Use(const Claims& claims, Seconds now) {
  Session* session = Find(claims.session_id);
  if (!session) return nullptr;
  if (now >= claims.expires || IsOver(*session, now) || session->uid != claims.uid ||
      session->user != claims.user) {
    sessions_.erase(claims.session_id);
    return nullptr;
  }
  session->last_used = now;
  return session;
}

Session* SessionTable::Find(const std::string& id) {
  const auto found = sessions_.find(id);
  return found == sessions_.end() ? nullptr : &found->second;
}

void SessionTable::Expire(Seconds now) {
  std::erase_if(sessions_, [&](const auto& entry) { return IsOver(entry.second, now); });
}

}  // namespace maru::server
