// The bare engine: the least that indexes a folder's files and answers queries with it, in process.
// What MaruSeeker adds is measured against it.
#include <xapian.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;
constexpr std::size_t kMaxText = 4u << 20;

double Since(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

std::string TextOf(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  std::string text(kMaxText, '\0');
  file.read(text.data(), static_cast<std::streamsize>(text.size()));
  text.resize(static_cast<std::size_t>(file.gcount()));
  const bool binary = text.substr(0, 4096).find('\0') != std::string::npos;
  return binary ? std::string() : text;
}

void IndexFiles(const std::vector<std::string>& paths, std::size_t first, std::size_t step,
                const std::string& target, std::size_t batch) {
  Xapian::WritableDatabase database(target, Xapian::DB_CREATE_OR_OVERWRITE);
  std::size_t waiting = 0;
  for (std::size_t i = first; i < paths.size(); i += step) {
    Xapian::Document document;
    document.set_data(paths[i]);
    document.add_value(0, Xapian::sortable_serialise(static_cast<double>(i)));
    Xapian::TermGenerator generator;
    generator.set_document(document);
    generator.index_text(TextOf(paths[i]));
    generator.index_text(paths[i].substr(paths[i].rfind('/') + 1), 1, "S");
    database.add_document(document);
    if (++waiting % batch == 0) database.commit();
  }
  database.commit();
}

int Index(const std::string& folder, const std::string& target, std::size_t writers,
          std::size_t batch) {
  const auto start = Clock::now();
  std::vector<std::string> paths;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(folder)) {
    if (entry.is_regular_file() && !entry.is_symlink()) paths.push_back(entry.path());
  }
  std::sort(paths.begin(), paths.end());
  if (writers == 1) {
    IndexFiles(paths, 0, 1, target, batch);
  } else {
    std::vector<std::thread> threads;
    for (std::size_t i = 0; i < writers; ++i) {
      threads.emplace_back(
          [&, i] { IndexFiles(paths, i, writers, target + "." + std::to_string(i), batch); });
    }
    for (std::thread& thread : threads) thread.join();
    Xapian::Database all;
    for (std::size_t i = 0; i < writers; ++i) {
      all.add_database(Xapian::Database(target + "." + std::to_string(i)));
    }
    all.compact(target);
    for (std::size_t i = 0; i < writers; ++i) {
      std::filesystem::remove_all(target + "." + std::to_string(i));
    }
  }
  std::cout << "{\"files\": " << paths.size() << ", \"seconds\": " << Since(start) << "}\n";
  return 0;
}

/// One search with what a page of hits shows; how many hits.
std::size_t Search(Xapian::Database& database, const std::string& words, bool exact) {
  Xapian::QueryParser parser;
  parser.set_database(database);
  parser.set_default_op(Xapian::Query::OP_AND);
  parser.set_max_expansion(100, Xapian::Query::WILDCARD_LIMIT_MOST_FREQUENT);
  Xapian::Enquire enquire(database);
  enquire.set_query(parser.parse_query(words, Xapian::QueryParser::FLAG_WILDCARD));
  const Xapian::MSet matches = enquire.get_mset(0, 50, exact ? database.get_doccount() : 0);
  std::size_t shown = 0;
  for (auto match = matches.begin(); match != matches.end(); ++match) {
    const Xapian::Document document = match.get_document();
    shown += !document.get_data().empty() && !document.get_value(0).empty();
  }
  return shown;
}

int Measure(const std::string& path, const std::string& queries, std::size_t rounds, bool exact) {
  std::vector<std::string> lines;
  std::ifstream file(queries);
  for (std::string line; std::getline(file, line);) lines.push_back(line);
  if (lines.empty() || rounds == 0) throw std::runtime_error("no queries in " + queries);
  Xapian::Database database(path);
  std::vector<double> times;
  std::size_t shown = 0;
  const auto start = Clock::now();
  for (std::size_t round = 0; round < rounds; ++round) {
    for (const std::string& line : lines) {
      const auto begin = Clock::now();
      shown += Search(database, line, exact);
      times.push_back(Since(begin) * 1e6);
    }
  }
  const double seconds = Since(start);
  std::sort(times.begin(), times.end());
  const auto at = [&](std::size_t percent) { return times[(times.size() - 1) * percent / 100]; };
  std::cout << "{\"p50\": " << at(50) << ", \"p95\": " << at(95) << ", \"p99\": " << at(99)
            << ", \"per_second\": " << static_cast<double>(times.size()) / seconds
            << ", \"shown\": " << shown << "}\n";
  return 0;
}

}  // namespace

int main(int count, char** words) {
  const std::vector<std::string> arguments(words + 1, words + count);
  try {
    if (arguments.size() == 5 && arguments[0] == "index") {
      return Index(arguments[1], arguments[2], std::stoul(arguments[3]), std::stoul(arguments[4]));
    }
    if (arguments.size() == 5 && arguments[0] == "search") {
      return Measure(arguments[1], arguments[2], std::stoul(arguments[3]), arguments[4] == "exact");
    }
  } catch (const Xapian::Error& error) {
    std::cerr << error.get_description() << "\n";
    return 1;
  } catch (const std::exception& error) {
    std::cerr << error.what() << "\n";
    return 1;
  }
  std::cerr << "Usage: maru-bench-engine index FOLDER DATABASE WRITERS BATCH\n"
               "       maru-bench-engine search DATABASE QUERIES ROUNDS best|exact\n"
               "Prints one JSON object: times in microseconds, or seconds of an indexing.\n";
  return 2;
}
