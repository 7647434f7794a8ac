#include "backup/FileHash.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

#include "device/Sha256.h"

namespace kx {

int hashFile(int fd, const std::function<bool()>& goOn, BackupPart* out) {
  constexpr std::size_t kPieceBytes = std::size_t{1} << 20;
  std::vector<std::uint8_t> buffer(kPieceBytes);
  Sha256 hash;
  out->size = 0;
  while (true) {
    const ssize_t count = ::pread(fd, buffer.data(), buffer.size(), out->size);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno;
    if (count == 0) break;
    hash.update({buffer.data(), static_cast<std::size_t>(count)});
    out->size += count;
    if (!goOn()) return ECANCELED;
  }
  out->sha256 = hash.hexDigest();
  return 0;
}

int hashFile(const DeviceRoot& root, const std::string& path, const std::function<bool()>& goOn,
             BackupPart* out) {
  UniqueFd fd;
  if (const int failed = root.openFile(path, O_RDONLY | O_NONBLOCK, &fd); failed != 0) {
    return failed;
  }
  return hashFile(fd.get(), goOn, out);
}

}  // namespace kx
