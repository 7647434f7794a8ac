#include "backup/FileCopy.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <span>
#include <vector>

#include "device/Sha256.h"

namespace kx {
namespace {

using Outcome = FileCopy::Outcome;

constexpr int kReadings = 3;
constexpr std::size_t kPieceBytes = std::size_t{1} << 20;

bool isSame(const struct stat& a, const struct stat& b) {
  return a.st_ino == b.st_ino && a.st_dev == b.st_dev && a.st_size == b.st_size &&
         a.st_mtim.tv_sec == b.st_mtim.tv_sec && a.st_mtim.tv_nsec == b.st_mtim.tv_nsec &&
         a.st_ctim.tv_sec == b.st_ctim.tv_sec && a.st_ctim.tv_nsec == b.st_ctim.tv_nsec;
}

int writeAll(int fd, std::span<const std::uint8_t> bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(fd, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno;
    bytes = bytes.subspan(static_cast<std::size_t>(count));
  }
  return 0;
}

FileCopy ended(Outcome outcome, int error = 0) { return {outcome, error, {}}; }

// All bytes of one open file to another, at most one piece more than `limit`.
FileCopy copyBytes(const FileCopyJob& job, int from, int to, std::int64_t limit) {
  std::vector<std::uint8_t> buffer(kPieceBytes);
  Sha256 hash;
  FileCopy copy;
  while (copy.file.size <= limit) {
    const ssize_t count = ::read(from, buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return ended(Outcome::kUnreadable, errno);
    if (count == 0) break;
    const std::span<const std::uint8_t> piece(buffer.data(), static_cast<std::size_t>(count));
    hash.update(piece);
    if (const int failed = writeAll(to, piece); failed != 0) {
      return ended(Outcome::kNotWritable, failed);
    }
    copy.file.size += count;
    if (!job.onBytes(count)) return ended(Outcome::kStopped);
  }
  copy.file.sha256 = hash.hexDigest();
  return copy;
}

FileCopy readOnce(const FileCopyJob& job, int target) {
  UniqueFd source;
  int failed = job.from.openFile(job.path, O_RDONLY | O_NONBLOCK, &source);
  if (failed == ENOENT || failed == ENOTDIR) return ended(Outcome::kGone);
  if (failed != 0) return ended(Outcome::kUnreadable, failed);
  struct stat before;
  if (::fstat(source.get(), &before) != 0) return ended(Outcome::kUnreadable, errno);
  if (!S_ISREG(before.st_mode)) return ended(Outcome::kUnreadable, EINVAL);
  FileCopy copy = copyBytes(job, source.get(), target, before.st_size);
  if (copy.outcome != Outcome::kCopied) return copy;
  struct stat after;
  if (::fstat(source.get(), &after) != 0) return ended(Outcome::kUnreadable, errno);
  if (!isSame(before, after) || copy.file.size != before.st_size) {
    job.onBytes(-copy.file.size);
    return ended(Outcome::kChanging);
  }
  copy.file.path = job.path;
  copy.file.modified = BackupFileTime::fromUnix(before.st_mtim);
  return copy;
}

FileCopy finish(const FileCopyJob& job, FileCopy copy, int target) {
  const struct timespec times[2] = {{0, UTIME_OMIT}, copy.file.modified.unixTime()};
  if (::futimens(target, times) != 0) return ended(Outcome::kNotWritable, errno);
  if (job.sync && ::fsync(target) != 0) return ended(Outcome::kNotWritable, errno);
  return copy;
}

}  // namespace

FileCopy copyFile(const FileCopyJob& job) {
  UniqueFd target;
  if (const int failed = job.to.openFile(job.target, O_WRONLY | O_CREAT | O_EXCL, &target);
      failed != 0) {
    return ended(Outcome::kNotWritable, failed);
  }
  FileCopy copy = ended(Outcome::kChanging);
  for (int reading = 0; reading < kReadings && copy.outcome == Outcome::kChanging; ++reading) {
    if (::ftruncate(target.get(), 0) != 0 || ::lseek(target.get(), 0, SEEK_SET) != 0) {
      copy = ended(Outcome::kNotWritable, errno);
      break;
    }
    copy = readOnce(job, target.get());
  }
  if (copy.outcome == Outcome::kCopied) copy = finish(job, std::move(copy), target.get());
  if (const int failed = target.close(); failed != 0 && copy.outcome == Outcome::kCopied) {
    copy = ended(Outcome::kNotWritable, failed);
  }
  if (copy.outcome != Outcome::kCopied) {
    if (const int failed = job.to.remove(job.target); failed != 0 && copy.error == 0) {
      copy.error = failed;
    }
  }
  return copy;
}

}  // namespace kx
