#include "indexer/update/workers.h"

#include <algorithm>
#include <exception>
#include <utility>

#include "indexer/extract/charset.h"
#include "indexer/extract/extractor.h"
#include "indexer/update/lane.h"
#include "system/log.h"

namespace maru::indexer {
namespace {

/// A text that the index refuses costs the file its text only.
index::Prepared Prepare(index::Document document, bool& failed) {
  std::string text = std::exchange(document.text, {});
  index::Document without_text = document;
  without_text.title.clear();
  without_text.authors.clear();
  document.text = std::move(text);
  try {
    return index::Prepared(std::move(document));
  } catch (const std::exception& error) {
    MARU_LOG("Indexed by name only: %s: %s", without_text.name.c_str(), error.what());
    failed = true;
    return index::Prepared(std::move(without_text));
  }
}

}  // namespace

Workers::Workers(extract::Processes& processes, std::size_t max_text)
    : processes_(processes), max_text_(max_text) {
  for (unsigned slot = 0; slot < processes.Slots(); ++slot) {
    threads_.emplace_back([this, slot] { Run(slot); });
  }
}

Workers::~Workers() {
  {
    const std::lock_guard lock(mutex_);
    closing_ = true;
  }
  work_.notify_all();
  for (std::thread& thread : threads_) thread.join();
}

void Workers::Run(unsigned slot) {
  while (true) {
    std::unique_lock lock(mutex_);
    work_.wait(lock, [this] { return closing_ || !queue_.empty(); });
    if (queue_.empty()) return;
    Item item = std::move(queue_.front());
    queue_.pop_front();
    lock.unlock();
    item.lane->Deliver(Work(slot, std::move(item.job)));
  }
}

void Workers::Submit(Lane& lane, Job job) {
  {
    const std::lock_guard lock(mutex_);
    queue_.push_back({&lane, std::move(job)});
  }
  work_.notify_one();
}

Result Workers::Work(unsigned slot, Job job) {
  bool failed = false;
  std::uint64_t bytes_read = 0;
  if (job.file) {
    try {
      failed = !TakeText(slot, job, bytes_read);
    } catch (const std::exception&) {
      failed = true;
    }
    job.file = UniqueFd();
  }
  std::string name = job.document.name;
  return {.folder = std::move(job.folder),
          .name = std::move(name),
          .stamp = job.stamp,
          .prepared = Prepare(std::move(job.document), failed),
          .failed = failed,
          .bytes_read = bytes_read,
          .cost = job.cost};
}

bool Workers::TakeText(unsigned slot, Job& job, std::uint64_t& bytes_read) {
  const int file = job.file.Get();
  std::string bytes = extract::ReadStart(file, extract::kHeadBytes);
  bytes_read = bytes.size();
  const std::size_t row = extract::ChooseExtractor(job.document.name, bytes);
  if (row == extract::kNoExtractor) return true;
  if (row == extract::PlainTextRow()) {
    // UTF-8 needs no understanding: to look through its bytes here spares most files the way over.
    if (bytes.size() == extract::kHeadBytes) bytes = extract::ReadStart(file, max_text_);
    bytes_read = bytes.size();
    if (const auto text = extract::UTF8Text(extract::TextPart(bytes))) {
      bytes.resize(text->size());
      job.document.text = std::move(bytes);
      return true;
    }
  }
  bytes = {};
  std::optional<extract::Extracted> extracted = processes_.Extract(slot, row, file, max_text_);
  if (!extracted) return false;
  bytes_read = std::max<std::uint64_t>(bytes_read, job.document.size);
  job.document.title = std::move(extracted->title);
  job.document.authors = std::move(extracted->authors);
  job.document.text = std::move(extracted->text);
  return true;
}

}  // namespace maru::indexer
