#include "system/config.h"

#include <errno.h>

#include <charconv>
#include <mutex>
#include <stdexcept>
#include <string_view>
#include <utility>

#include "system/keep_errno.h"
#include "system/text.h"
#include "system/throw_errno.h"
#include "system/whole_file.h"

namespace maru {
namespace {

constexpr std::size_t kMaxFile = 1u << 20;

constexpr Setting kSettings[] = {
    {"web_account", &Config::web_account, Setting::kWord, 0, 0,
     "Account of the part of the web server that talks to clients."},
    {"admin_group", &Config::admin_group, Setting::kText, 0, 0,
     "Members of this group see every file and may use the operators' commands."},
    {"samba_config", &Config::samba_config, Setting::kPath, 0, 0,
     "Samba settings that define the shared folders."},
    {"samba_config_canonical", &Config::samba_config_canonical, Setting::kFlag, 0, 0,
     "The Samba settings already have the form that testparm -sv prints."},
    {"state_dir", &Config::state_dir, Setting::kPath, 0, 0,
     "Folder of the index, the search history and the preferences."},
    {"history_database", &Config::history_database, Setting::kText, 0, 0,
     "SOCI connection string of the search history; empty for SQLite in state_dir."},
    {"listen_address", &Config::listen_address, Setting::kWord, 0, 0,
     "Address on which the web server listens."},
    {"listen_port", &Config::listen_port, Setting::kNumber, 1, 65'535,
     "Port on which the web server listens."},
    {"tls_certificate", &Config::tls_certificate, Setting::kOptionalPath, 0, 0,
     "Certificate chain for TLS, in PEM form; empty for none."},
    {"tls_key", &Config::tls_key, Setting::kOptionalPath, 0, 0,
     "Private key for TLS, in PEM form; empty for none."},
    {"behind_proxy", &Config::behind_proxy, Setting::kFlag, 0, 0,
     "A proxy in front holds TLS: allows an address beyond loopback without a certificate."},
    {"plugin", &Config::plugin, Setting::kOptionalPath, 0, 0,
     "The plug-in that the web server loads; empty for the installed one."},
    {"page_dir", &Config::page_dir, Setting::kOptionalPath, 0, 0,
     "Folder of the search page; empty for the installed one."},
    {"session_minutes", &Config::session_minutes, Setting::kNumber, 1, 43'200,
     "Minutes without a request after which a session ends."},
    {"max_text_kib", &Config::max_text_kib, Setting::kNumber, 1, 1'048'576,
     "The most text of one file that is indexed, in KiB."},
};

/// Names that files of earlier versions may have, and what to say of them.
constexpr std::pair<std::string_view, const char*> kFormerSettings[] = {
    {"service_account", "is no longer a setting: the account is always MaruSeeker"},
    {"daemon_socket", "is no longer a setting: the socket is always /var/run/maruelasticd.sock"},
};

/// Null, or what is wrong with the value.
const char* Fault(Setting::Form form, std::string_view value) {
  const bool absolute = value.starts_with('/');
  if (form == Setting::kWord && (value.empty() || value.find_first_of(" \t") != value.npos)) {
    return "must be one word";
  }
  if (form == Setting::kPath && !absolute) return "must be an absolute path";
  if (form == Setting::kOptionalPath && !absolute && !value.empty()) {
    return "must be an absolute path or empty";
  }
  return nullptr;
}

/// Null, or what is wrong with the value.
const char* Assign(Config& config, const Setting& setting, std::string_view value) {
  if (const auto* text = std::get_if<std::string Config::*>(&setting.member)) {
    if (const char* fault = Fault(setting.form, value)) return fault;
    config.** text = value;
  } else if (const auto* number = std::get_if<int Config::*>(&setting.member)) {
    int parsed = 0;
    const auto [end, error] = std::from_chars(value.data(), value.data() + value.size(), parsed);
    if (error != std::errc() || end != value.data() + value.size()) return "must be a number";
    if (parsed < setting.minimum || parsed > setting.maximum) return "is out of bounds";
    config.** number = parsed;
  } else {
    const std::optional<bool> flag = Truth(value);
    if (!flag) return "must be yes or no";
    config.*std::get<bool Config::*>(setting.member) = *flag;
  }
  return nullptr;
}

/// Null, or what is wrong with the line.
const char* Apply(Config& config, std::string_view line) {
  const std::size_t equals = line.find('=');
  if (equals == line.npos) return "is not of the form name = value";
  const std::string_view name = Trimmed(line.substr(0, equals));
  for (const Setting& setting : kSettings) {
    if (name == setting.name) return Assign(config, setting, Trimmed(line.substr(equals + 1)));
  }
  for (const auto& [former, fault] : kFormerSettings) {
    if (name == former) return fault;
  }
  return "is an unknown setting";
}

Config Parse(const std::string& path, std::string_view text) {
  Config config;
  for (int number = 1; !text.empty(); ++number) {
    const std::size_t end = std::min(text.find('\n'), text.size());
    const std::string_view line = Trimmed(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
    if (line.empty() || line.starts_with('#') || line.starts_with(';')) continue;
    if (const char* fault = Apply(config, line)) {
      throw std::runtime_error(path + ":" + std::to_string(number) + ": \"" + std::string(line) +
                               "\" " + fault);
    }
  }
  return config;
}

std::mutex mutex;
bool loaded = false;
Config current;

const Config& LoadLocked(const std::string& path, bool may_be_missing) {
  const KeepErrno keep;
  std::string text;
  if (!ReadWholeFile(path, kMaxFile, text, Link::kFollow) && !(may_be_missing && errno == ENOENT)) {
    ThrowErrno(path);
  }
  current = Parse(path, text);
  loaded = true;
  return current;
}

}  // namespace

const Config& Config::Get() {
  const std::lock_guard lock(mutex);
  return loaded ? current : LoadLocked(kDefaultPath, true);
}

const Config& Config::Load(const std::string& path) {
  const std::lock_guard lock(mutex);
  return LoadLocked(path, false);
}

std::string Setting::ValueIn(const Config& config) const {
  if (const auto* text = std::get_if<std::string Config::*>(&member)) return config.**text;
  if (const auto* number = std::get_if<int Config::*>(&member)) {
    return std::to_string(config.**number);
  }
  return config.*std::get<bool Config::*>(member) ? "yes" : "no";
}

std::span<const Setting> Settings() {
  return kSettings;
}

}  // namespace maru
