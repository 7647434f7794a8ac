#include "cli/PlanText.h"

#include <algorithm>
#include <array>
#include <nlohmann/json.hpp>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "cli/Progress.h"
#include "daemon/SyncJson.h"

namespace kx::cli {
namespace {

using Json = nlohmann::ordered_json;
using Asset = LibraryDifference::Asset;
using Container = LibraryDifference::Container;
using Fate = LibraryDifference::Fate;

constexpr std::size_t kJsonChunkBytes = std::size_t{1} << 16;

const char* entityOf(std::int32_t kind) {
  switch (listOfKind(kind)) {
    case ListId::kEvents:
      return "event";
    case ListId::kFaceAlbums:
      return "faceAlbum";
    case ListId::kAlbums:
      break;
  }
  return "album";
}

const char* wordFor(std::int32_t kind) {
  return listOfKind(kind) == ListId::kFaceAlbums ? "face album" : entityOf(kind);
}

const char* listName(ListId list) {
  switch (list) {
    case ListId::kAlbums:
      return "albums";
    case ListId::kEvents:
      return "events";
    case ListId::kFaceAlbums:
      break;
  }
  return "face albums";
}

bool isChangedInPlace(const Asset& asset) {
  return asset.fate == Fate::kKept && !asset.content &&
         (asset.place || asset.faces || asset.sortToken);
}

bool hasOtherMembers(const Container& container) {
  return container.fate == Fate::kKept &&
         (container.joined + container.left > 0 || container.reordered);
}

// Made anew under the same identifier, with another title.
bool isRetitled(const Container& container) {
  return container.fate == Fate::kKept && !container.renamed &&
         container.title != container.titleBefore;
}

std::string joined(const std::vector<std::string>& parts) {
  std::string text;
  for (const std::string& part : parts) text += (text.empty() ? "" : ", ") + part;
  return text;
}

// Finds what the host says of the files that would be brought.
class Requests {
 public:
  explicit Requests(const SyncPlan& plan) {
    byUUID_.reserve(plan.requests.size());
    for (const SyncPlan::Request& request : plan.requests) byUUID_.emplace(request.uuid, &request);
  }

  const SyncPlan::Request* find(const Asset& asset) const {
    const auto found = byUUID_.find(asset.uuid);
    return found == byUUID_.end() ? nullptr : found->second;
  }
  std::string nameOf(const Asset& asset) const {
    if (asset.originalFileName && !asset.originalFileName->empty()) return *asset.originalFileName;
    const SyncPlan::Request* request = find(asset);
    return request != nullptr && request->caption ? *request->caption : asset.uuid;
  }
  std::string sizeOf(const Asset& asset) const {
    const SyncPlan::Request* request = find(asset);
    if (request == nullptr || !request->size || *request->size < 0) return {};
    return readableBytes(static_cast<std::uint64_t>(*request->size));
  }

 private:
  std::unordered_map<std::string_view, const SyncPlan::Request*> byUUID_;
};

std::string withDetail(const std::string& line, const std::string& detail) {
  return detail.empty() ? line : line + "  (" + detail + ")";
}

std::string assetLine(char symbol, const Asset& asset, const Requests& requests) {
  std::vector<std::string> details;
  if (asset.content) details.emplace_back("edited");
  if (asset.place) details.emplace_back("place");
  if (asset.faces) details.emplace_back("faces");
  if (asset.sortToken && !asset.content) details.emplace_back("order");
  if (asset.fate == Fate::kGone && requests.find(asset) != nullptr) {
    details.emplace_back("its new version does not arrive");
  } else if (const std::string size = requests.sizeOf(asset); !size.empty()) {
    details.push_back(size);
  }
  const std::string line = std::string(1, symbol) + (asset.isVideo ? " video " : " photo ");
  return withDetail(line + requests.nameOf(asset), joined(details));
}

std::string titleOr(const std::optional<std::string>& title) { return title.value_or("untitled"); }

std::string containerLine(char symbol, const Container& container) {
  return std::string(1, symbol) + " " + wordFor(container.kind) + " " + titleOr(container.title);
}

std::string membersText(const Container& container) {
  std::vector<std::string> parts;
  if (container.joined > 0) parts.push_back(groupedNumber(container.joined) + " join");
  if (container.left > 0) parts.push_back(groupedNumber(container.left) + " leave");
  if (container.reordered) parts.emplace_back("another order");
  if (isRetitled(container)) parts.push_back("was " + titleOr(container.titleBefore));
  return joined(parts);
}

class Groups {
 public:
  explicit Groups(const SyncPlan& plan) : requests_(plan) {
    for (const Asset& asset : plan.difference.assets) addAsset(asset);
    for (const Container& container : plan.difference.containers) addContainer(container);
    for (const ListId list : plan.difference.reorderedLists) {
      group(kChangedContainers).push_back([list] {
        return std::string("* the list of ") + listName(list) + "  (another order)";
      });
    }
  }

  void print(std::size_t limit, const std::function<void(const std::string&)>& line) const {
    const std::array<std::size_t, kGroupCount> shares = sharesOf(limit);
    for (std::size_t i = 0; i < kGroupCount; ++i) {
      const auto& lines = lines_[i];
      for (std::size_t n = 0; n < shares[i]; ++n) line(lines[n]());
      if (shares[i] == lines.size()) continue;
      line(std::string(1, kSymbols[i]) + " ... and " + groupedNumber(lines.size() - shares[i]) +
           " more " + kNouns[i] + " (--all lists them)");
    }
  }

 private:
  enum GroupIndex : std::size_t {
    kNewAssets,
    kChangedAssets,
    kGoneAssets,
    kNewContainers,
    kRenamedContainers,
    kChangedContainers,
    kGoneContainers,
    kGroupCount
  };
  static constexpr std::array<char, kGroupCount> kSymbols = {'+', '*', '-', '+', '>', '*', '-'};
  static constexpr std::array<const char*, kGroupCount> kNouns = {
      "new photos and videos",    "changed photos and videos", "that go",
      "new albums and events",    "renamed albums and events", "changed albums and events",
      "albums and events that go"};

  std::vector<std::function<std::string()>>& group(GroupIndex index) { return lines_[index]; }

  void addAsset(const Asset& asset) {
    const auto add = [&](GroupIndex index) {
      group(index).push_back(
          [this, &asset, index] { return assetLine(kSymbols[index], asset, requests_); });
    };
    if (asset.fate == Fate::kNew) add(kNewAssets);
    if (asset.fate == Fate::kGone) add(kGoneAssets);
    if (asset.content || isChangedInPlace(asset)) add(kChangedAssets);
  }

  void addContainer(const Container& container) {
    const auto members = [](std::size_t count) {
      return withDetail("", groupedNumber(count) + " in it");
    };
    if (container.fate == Fate::kNew) {
      group(kNewContainers).push_back([&container, members] {
        return containerLine('+', container) + members(container.joined);
      });
    }
    if (container.fate == Fate::kGone) {
      group(kGoneContainers).push_back([&container, members] {
        return containerLine('-', container) + members(container.left);
      });
    }
    if (container.renamed) {
      group(kRenamedContainers).push_back([&container] {
        return "> " + std::string(wordFor(container.kind)) + " " + titleOr(container.titleBefore) +
               " -> " + titleOr(container.title);
      });
    }
    if (hasOtherMembers(container) || isRetitled(container)) {
      group(kChangedContainers).push_back([&container] {
        return withDetail(containerLine('*', container), membersText(container));
      });
    }
  }

  // Small kinds are shown whole; the large ones share evenly what is left.
  std::array<std::size_t, kGroupCount> sharesOf(std::size_t limit) const {
    std::array<std::size_t, kGroupCount> shares{};
    std::array<std::size_t, kGroupCount> bySize{};
    for (std::size_t i = 0; i < kGroupCount; ++i) bySize[i] = i;
    std::stable_sort(bySize.begin(), bySize.end(), [this](std::size_t a, std::size_t b) {
      return lines_[a].size() < lines_[b].size();
    });
    std::size_t left = limit;
    for (std::size_t i = 0; i < kGroupCount; ++i) {
      const std::size_t size = lines_[bySize[i]].size();
      const std::size_t share = limit == 0 ? size : std::min(size, left / (kGroupCount - i));
      shares[bySize[i]] = share;
      left -= limit == 0 ? 0 : share;
    }
    return shares;
  }

  const Requests requests_;
  std::array<std::vector<std::function<std::string()>>, kGroupCount> lines_;
};

Json optionalText(const std::optional<std::string>& text) { return text ? Json(*text) : nullptr; }

Json assetJson(const Asset& asset, const Requests& requests) {
  const SyncPlan::Request* request = requests.find(asset);
  Json what = Json::array();
  if (asset.content) what.push_back("content");
  if (asset.place) what.push_back("place");
  if (asset.faces) what.push_back("faces");
  if (asset.sortToken) what.push_back("order");
  if (asset.memberships) what.push_back("albums");
  const char* action = asset.fate == Fate::kNew    ? "new"
                       : asset.fate == Fate::kGone ? "gone"
                                                   : "changed";
  Json json{{"action", action},
            {"entity", "asset"},
            {"uuid", asset.uuid},
            {"name", requests.nameOf(asset)},
            {"isVideo", asset.isVideo}};
  if (asset.fate == Fate::kKept) json["what"] = std::move(what);
  json["bytes"] = request != nullptr && request->size ? Json(*request->size) : Json(nullptr);
  return json;
}

Json containerJson(const Container& container) {
  const char* action = container.fate == Fate::kNew    ? "new"
                       : container.fate == Fate::kGone ? "gone"
                       : container.renamed             ? "renamed"
                                                       : "changed";
  Json json{{"action", action},
            {"entity", entityOf(container.kind)},
            {"uuid", container.uuid},
            {"title", optionalText(container.title)}};
  if (container.title != container.titleBefore && container.fate == Fate::kKept) {
    json["titleBefore"] = optionalText(container.titleBefore);
  }
  json["joined"] = container.joined;
  json["left"] = container.left;
  json["reordered"] = container.reordered;
  return json;
}

Json totalsJson(const SyncPlan& plan) {
  Json json = syncResultJson(plan.result);
  json["bytesToBring"] = plan.bytesToBring;
  json["bytesToFree"] = plan.bytesToFree;
  json["guard"] = nullptr;
  if (plan.guard) {
    json["guard"] = Json{{"deletes", plan.guard->deletes},
                         {"photos", plan.guard->photos},
                         {"videos", plan.guard->videos},
                         {"synced", plan.guard->syncedAssets}};
  }
  json["space"] = nullptr;
  if (plan.space) {
    json["space"] = Json{{"needed", plan.space->needed},
                         {"kept", plan.space->kept},
                         {"free", plan.space->free},
                         {"missing", plan.space->missing}};
  }
  return json;
}

}  // namespace

void describeActions(const SyncPlan& plan, std::size_t limit,
                     const std::function<void(const std::string&)>& line) {
  Groups(plan).print(limit, line);
}

bool changesNothing(const SyncPlan& plan) {
  const LibraryDifference& difference = plan.difference;
  return plan.requests.empty() && difference.assets.empty() && difference.containers.empty() &&
         difference.reorderedLists.empty();
}

void describeTotals(const SyncPlan& plan, const std::function<void(const std::string&)>& line) {
  std::size_t made = 0, edited = 0, changed = 0, moved = 0, gone = 0, containersChanged = 0;
  for (const Asset& asset : plan.difference.assets) {
    made += asset.fate == Fate::kNew ? 1U : 0U;
    gone += asset.fate == Fate::kGone ? 1U : 0U;
    edited += asset.content ? 1U : 0U;
    changed += isChangedInPlace(asset) ? 1U : 0U;
    moved += asset.fate == Fate::kKept && !asset.content && !isChangedInPlace(asset) ? 1U : 0U;
  }
  for (const Container& container : plan.difference.containers) {
    containersChanged += hasOtherMembers(container) || isRetitled(container) ? 1U : 0U;
  }
  const auto n = [](std::size_t number) { return groupedNumber(number); };
  const SyncResult& result = plan.result;
  line("Assets      " + n(made) + " new, " + n(edited + changed) + " changed, " + n(moved) +
       " moved, " + n(gone) + " gone");
  line("Containers  " + n(result.albumsCreated) + " new, " + n(result.albumsRenamed) +
       " renamed, " + n(containersChanged) + " changed, " + n(result.albumsDeleted) + " gone");
  line("Files       " + n(result.requested) + " to bring, " + readableBytes(plan.bytesToBring) +
       "; " + n(gone + edited) + " to delete, " + readableBytes(plan.bytesToFree));
}

void writePlanJson(const SyncPlan& plan, const std::string& hostProblems,
                   const std::function<void(const std::string&)>& write) {
  std::string text = dumpJson(totalsJson(plan));
  text.back() = ',';
  text += "\"actions\":[";
  bool first = true;
  const auto add = [&](const Json& action) {
    if (!first) text += ",";
    first = false;
    text += dumpJson(action);
    if (text.size() < kJsonChunkBytes) return;
    write(text);
    text.clear();
  };
  const Requests requests(plan);
  for (const Asset& asset : plan.difference.assets) add(assetJson(asset, requests));
  for (const Container& container : plan.difference.containers) add(containerJson(container));
  for (const ListId list : plan.difference.reorderedLists) {
    add(Json{{"action", "changed"}, {"entity", "list"}, {"name", listName(list)}});
  }
  write(text + "],\"hostProblems\":" + hostProblems + "}\n");
}

}  // namespace kx::cli
