#include "device/LibraryStore.h"

#include <algorithm>
#include <cerrno>
#include <charconv>

#include "device/DeviceErrors.h"
#include "device/LibraryContext.h"
#include "device/LibrarySchema.h"

namespace kx {
namespace {

constexpr std::string_view kScheme = "kxlibrary://";
constexpr std::string_view kAlbumPath = "/Album/p";

RowId largest(SqliteDatabase& database, const char* sql) {
  SqliteStatement statement(database, sql);
  return statement.step() ? statement.integerAt(0) : 0;
}

}  // namespace

LibraryStore::LibraryStore(Parts parts)
    : parts_(std::move(parts)),
      order_(*parts_.files, *parts_.log),
      queue_(DispatchQueue::serial("com.veltro.photolibrary")) {
  SqliteStatement store(database(), "SELECT value FROM info WHERE key = 'store'");
  if (store.step()) storeUUID_ = store.textAt(0);
  lastAlbum_ = largest(database(), "SELECT seq FROM sqlite_sequence WHERE name = 'albums'");
  lastFace_ = largest(database(), "SELECT coalesce(max(pk), 0) FROM faces");
}

LibraryStore::~LibraryStore() = default;

void LibraryStore::beginReading() {
  if (!parts_.planOnly && !isReading_) isReading_ = database().beginReading();
}

void LibraryStore::endReading() {
  if (std::exchange(isReading_, false)) database().endReading();
}

std::unique_ptr<SqliteDatabase> LibraryStore::openBeside() {
  // What a plan has changed is not committed.
  if (parts_.planOnly ? database().rowsWritten() != 0 : !isReading_) return nullptr;
  const std::string path = database().path();
  return path.empty() ? nullptr : openLibraryForReading(path, nullptr).database;
}

ErrorPtr LibraryStore::write(const Work& work, const LibraryContext* origin) {
  endReading();
  ErrorPtr failure = broken_;
  if (parts_.readOnly) failure = systemError("cannot write", "the library", EROFS);
  if (!failure) {
    LibraryWriter writer(database(), order_, positions_);
    writer.setAtHand([&](RowId asset) { return savedAtHand(asset, writer.rows()); });
    try {
      database().execute(parts_.planOnly ? "SAVEPOINT work" : "BEGIN IMMEDIATE");
      work(writer);
      if (parts_.planOnly) {
        database().execute("RELEASE work");
      } else {
        database().commit();
      }
      published(writer, origin);
      return nullptr;
    } catch (const SqliteError& error) {
      failure = error.asError();
      if (error.endsTheSync()) broken_ = failure;
    } catch (const DeviceFailure& error) {
      failure = error.error();
    } catch (const std::exception& error) {
      failure = deviceError(DeviceError::kIo, error.what());
    }
    positions_.clear();
    try {
      if (parts_.planOnly) {
        database().execute("ROLLBACK TO work; RELEASE work");
      } else {
        database().rollback();
      }
    } catch (const SqliteError& error) {
      broken_ = error.asError();
    }
  }
  health().noteFailure("a library transaction was rolled back", failure);
  return failure;
}

// What the transaction has changed by now is left to the table.
std::optional<LibraryWriter::AssetAtHand> LibraryStore::savedAtHand(
    RowId asset, const RowChanges& changed) const {
  if (changed.assets.contains(asset)) return std::nullopt;
  for (const LibraryContext* context : contexts_) {
    if (auto known = context->savedAtHand(asset)) return known;
  }
  return std::nullopt;
}

std::int64_t LibraryStore::dataVersion() {
  SqliteStatement row(database(), "PRAGMA data_version");
  return row.step() ? row.integerAt(0) : 0;
}

bool LibraryStore::showRowsReadAhead(const std::function<bool(const AssetRow&)>& visit) {
  return std::any_of(contexts_.begin(), contexts_.end(),
                     [&](LibraryContext* context) { return context->showRowsReadAhead(visit); });
}

void LibraryStore::published(LibraryWriter& writer, const LibraryContext* origin) {
  {
    std::lock_guard<std::mutex> lock(changesMutex_);
    LibraryChanges& news = writer.changes();
    changes_.importedAssets.merge(news.importedAssets);
    changes_.deletedAssets.merge(news.deletedAssets);
    changes_.updatedAssets.merge(news.updatedAssets);
    changes_.createdContainers.merge(news.createdContainers);
    changes_.deletedContainers.merge(news.deletedContainers);
    changes_.renamedContainers.merge(news.renamedContainers);
  }
  for (LibraryContext* context : contexts_) {
    context->noteWritten(writer.rows());
    if (context != origin) context->refreshRows(writer.rows());
  }
  if (releaser_ && !writer.releasedFiles().empty()) releaser_(std::move(writer.releasedFiles()));
  if (onCommit_) onCommit_();
}

ObjectID LibraryStore::objectID(const char* entity, RowId pk) const {
  return ObjectID(std::string(kScheme) + storeUUID_ + "/" + entity + "/p" + std::to_string(pk));
}

std::optional<RowId> LibraryStore::albumOfURI(std::string_view uri) const {
  const std::string prefix = std::string(kScheme) + storeUUID_ + std::string(kAlbumPath);
  if (!uri.starts_with(prefix)) return std::nullopt;
  uri.remove_prefix(prefix.size());
  RowId pk = 0;
  const auto [end, failed] = std::from_chars(uri.data(), uri.data() + uri.size(), pk);
  if (failed != std::errc() || end != uri.data() + uri.size() || pk <= 0) return std::nullopt;
  return pk;
}

LibraryChanges LibraryStore::takeChanges() {
  std::lock_guard<std::mutex> lock(changesMutex_);
  return std::exchange(changes_, {});
}

void LibraryStore::onQueue(const Block& block) {
  if (queue_->isCurrent()) {
    block();
  } else {
    queue_->sync(block);
  }
}

DeviceCounters LibraryStore::takeCounters() {
  DeviceCounters since;
  onQueue([&] {
    const DeviceCounters now{database().statementsRun(), database().rowsWritten(), listSorts_};
    since = {now.statements - counted_.statements, now.rowsWritten - counted_.rowsWritten,
             now.listSorts - counted_.listSorts};
    counted_ = now;
  });
  return since;
}

}  // namespace kx
