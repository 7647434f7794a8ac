// Decodes a snapshot file into records once, reads every field of every record once, and prints
// one line of JSON: the processor's seconds from bytes in memory to the last field, and how much
// the process grew meanwhile. bench/compare runs it beside other readers of the same bytes.
#include <sys/resource.h>

#include <cstdio>
#include <ctime>
#include <fstream>
#include <iterator>
#include <string>

#include "daemon/ProcessMemory.h"
#include "platform/foundation/PropertyList.h"
#include "transport/KXSTransportDecoder.h"

namespace kx {
namespace {

// Text lengths and numbers added up, so that no reading can be left out.
class Sum {
 public:
  void add(const OptionalString& text) { total_ += text ? static_cast<double>(text->size()) : 0; }
  void add(const std::optional<Number>& number) { total_ += number ? number->doubleValue() : 0; }
  void add(bool flag) { total_ += flag ? 1 : 0; }
  void add(const std::optional<ArrayView>& list) {
    if (!list) return;
    for (std::size_t i = 0; i < list->size(); ++i) add(list->stringAt(i, "element"));
  }
  void addFaces(const KXSAsset& asset) {
    for (const KXSFacePtr& face : asset.getFacesArray()) {
      add(face->albumUUID());
      total_ += face->identifier() + face->relativeRect().width;
    }
  }
  double total() const { return total_; }

 private:
  double total_ = 0;
};

void readAsset(const KXSAsset& asset, Sum& sum) {
  sum.add(asset.uuid());
  sum.add(asset.rating());
  sum.add(asset.isFlagged());
  sum.add(asset.isVideo());
  sum.add(asset.caption());
  sum.add(asset.eventUUID());
  sum.add(asset.adjustments());
  sum.add(asset.exposureDate());
  sum.add(asset.modificationDate());
  sum.add(asset.longitude());
  sum.add(asset.latitude());
  sum.add(asset.originalFileName());
  sum.add(asset.properties() != nullptr);
  sum.addFaces(asset);
}

void readContainer(const KXSItem& item, Sum& sum) {
  sum.add(item.uuid());
  if (const auto* album = dynamic_cast<const KXSAlbum*>(&item)) {
    sum.add(album->name());
    sum.add(album->albumSubclass());
    sum.add(album->parentUUID());
    sum.add(album->assetUUIDs());
  } else if (const auto* event = dynamic_cast<const KXSEvent*>(&item)) {
    sum.add(event->name());
    sum.add(event->parentUUID());
    sum.add(event->keyAssetUUID());
  }
}

double processorSeconds() {
  timespec now = {};
  ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

long peakKibibytes() {
  rusage usage = {};
  ::getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

int run(const char* path) {
  DataPtr bytes;
  {
    std::ifstream stream(path, std::ios::binary | std::ios::ate);
    std::vector<std::uint8_t> read(stream ? static_cast<std::size_t>(stream.tellg()) : 0);
    stream.seekg(0);
    stream.read(reinterpret_cast<char*>(read.data()), static_cast<std::streamsize>(read.size()));
    if (!stream) {
      std::fprintf(stderr, "%s cannot be read\n", path);
      return 1;
    }
    bytes = std::make_shared<const Data>(std::move(read));
  }
  const std::size_t fileBytes = bytes->length();
  const long before = peakKibibytes();
  const double start = processorSeconds();
  ErrorPtr error;
  const Value root = readPropertyList(bytes, &error);
  if (error) {
    std::fprintf(stderr, "%s: %s\n", path, error->message().c_str());
    return 1;
  }
  const double strict = processorSeconds();
  const auto snapshot =
      KXSTransportDecoder::decoder()->decodeSnapshotFromPropertyList(root, &error);
  const double decoded = processorSeconds();
  Sum sum;
  for (const KXSItemPtr& item : *snapshot->orderedAlbums()) readContainer(*item, sum);
  for (const auto& entry : *snapshot->assetsByUUID()) readAsset(*entry.value, sum);
  const double end = processorSeconds();
  std::printf(
      "{\"seconds\": %.6f, \"read\": %.6f, \"decode\": %.6f, \"fields\": %.6f, \"assets\": %zu, "
      "\"fileBytes\": %zu, \"grownBytes\": %ld, \"sum\": %.17g}\n",
      end - start, strict - start, decoded - strict, end - decoded,
      snapshot->assetsByUUID()->size(), fileBytes, (peakKibibytes() - before) * 1024, sum.total());
  return 0;
}

}  // namespace
}  // namespace kx

int main(int count, char** arguments) {
  if (count != 2) {
    std::fprintf(stderr, "usage: decode-snapshot FILE\n");
    return 2;
  }
  kx::keepFreedMemory();  // as the programs do
  return kx::run(arguments[1]);
}
