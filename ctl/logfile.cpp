#include "logfile.h"

#include <algorithm>

namespace {

constexpr std::size_t BlockSize = 256UL * 1024;

} // namespace

std::string logPath(const std::string &home) {
  return home + "patchlogs/orvpatch.log";
}

void feedLog(const InputFile &file, std::uint64_t from, std::uint64_t to, RunLog &log) {
  const std::unique_ptr<char[]> block(new char[BlockSize]);
  file.seek(from);
  while (from < to) {
    const std::size_t wanted = static_cast<std::size_t>(std::min<std::uint64_t>(BlockSize, to - from));
    const std::size_t count = file.read(block.get(), wanted);
    if (count == 0)
      return; // cut off while it was read
    log.feed({block.get(), count});
    from += count;
  }
}

LogFollower::LogFollower(const std::string &path, std::uint64_t offset)
    : path_(path), file_(std::make_unique<InputFile>(path)), offset_(offset) {}

bool LogFollower::feedRest(RunLog &log) {
  const std::uint64_t size = file_->size();
  if (size < offset_)
    offset_ = 0; // its content was taken away, what comes now stands at the start
  if (size == offset_)
    return false;
  feedLog(*file_, offset_, size, log);
  offset_ = size;
  return true;
}

bool LogFollower::poll(RunLog &log) {
  if (feedRest(log))
    return true;
  if (file_->isStillThere())
    return false;
  auto next = std::make_unique<InputFile>(path_);
  if (!next->exists())
    return false;
  // A line may have come to the old one between the last look and its new name.
  const bool hadMore = feedRest(log);
  file_ = std::move(next);
  offset_ = 0;
  return feedRest(log) || hadMore;
}
