#pragma once

#include <span>
#include <string>
#include <variant>

namespace maru {

/// The one configuration: /etc/maruseeker/maruseeker.conf, lines `name = value`, `#` and `;`
/// comments. Every setting has a default; an unknown name or a bad value is an error that names
/// file and line.
struct Config {
  // Accounts
  std::string web_account = "maruweb";
  std::string admin_group = "administrators";
  // Shared folders: an existing smb.conf is read through testparm; `samba_config_canonical` says
  // the file is already in the form that testparm -sv prints.
  std::string samba_config = "/etc/samba/smb.conf";
  bool samba_config_canonical = false;
  // Places
  std::string state_dir = "/var/lib/maruseeker";
  /// SOCI connection string; empty: SQLite in the state folder.
  std::string history_database;
  // Web server
  std::string listen_address = "127.0.0.1";
  int listen_port = 5080;
  std::string tls_certificate;
  std::string tls_key;
  /// A proxy in front holds TLS: allows a listen address beyond loopback without a certificate.
  bool behind_proxy = false;
  std::string plugin;
  std::string page_dir;
  int session_minutes = 480;
  // Indexing
  int max_text_kib = 4096;

  /// The configuration of this process: what Load read, else the file at kDefaultPath (defaults
  /// when there is none; an unreadable or bad one throws std::runtime_error).
  static const Config& Get();
  /// Reads a file and makes it this process's configuration. Once, before threads start.
  static const Config& Load(const std::string& path);

  static constexpr const char* kDefaultPath = "/etc/maruseeker/maruseeker.conf";
};

/// One row of the table of settings.
struct Setting {
  enum Form { kWord, kPath, kOptionalPath, kText, kNumber, kFlag };

  const char* name;
  std::variant<std::string Config::*, int Config::*, bool Config::*> member;
  Form form;
  /// Bounds of a number.
  int minimum, maximum;
  /// One sentence for a person.
  const char* help;

  /// The value as it is written in the file: text, a number, or yes or no.
  std::string ValueIn(const Config& config) const;
};

/// All settings, in the order in which they are shown.
std::span<const Setting> Settings();

}  // namespace maru
