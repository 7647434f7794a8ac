#pragma once

#include <string_view>

namespace kx {

// The key names and fixed texts of the snapshot file, as docs/formats/snapshot.md describes them,
// and of the archived forms of the records. Literals: safe from any thread.

// Root dictionary.
inline constexpr std::string_view kKXSTransportLibraryUUIDKey = "libraryUUID";
inline constexpr std::string_view kKXSTransportLibraryKindKey = "libraryKind";
inline constexpr std::string_view kKXSTransportUpdatesKey = "updates";
inline constexpr std::string_view kKXSTransportDeletesKey = "deletes";

// Kinds of host library.
inline constexpr std::string_view kKXSTransportLibraryKindBrindleKey = "Brindle";
inline constexpr std::string_view kKXSTransportLibraryKindCassockKey = "Cassock";
inline constexpr std::string_view kKXSTransportLibraryKindFolderKey = "Folder";
inline constexpr std::string_view kKXSTransportLibraryKindDovetailStudioKey = "DovetailStudio";
inline constexpr std::string_view kKXSTransportLibraryKindDovetailAlbumKey = "DovetailAlbum";

// Every item.
inline constexpr std::string_view kKXSItemUUIDKey = "uuid";
inline constexpr std::string_view kKXSTransportItemTypeKey = "itemType";
inline constexpr std::string_view kKXSTransportUserInfoKey = "userInfo";
inline constexpr std::string_view kKXSTransportAssetItemType = "Asset";
inline constexpr std::string_view kKXSTransportAlbumItemType = "Album";
inline constexpr std::string_view kKXSTransportEventItemType = "Event";

// Albums and events.
inline constexpr std::string_view kKXSAlbumNameKey = "albumName";
inline constexpr std::string_view kKXSAlbumAssetUUIDsKey = "assetUUIDs";
inline constexpr std::string_view kKXSAlbumParentUUIDKey = "parentUUID";
inline constexpr std::string_view kKXSAlbumSubclassKey = "subclass";
inline constexpr std::string_view kKXSAlbumKeyAssetFaceIndexKey = "keyAssetFaceIndex";
inline constexpr std::string_view kKXSKeyAssetUUIDKey = "keyAssetUUID";
inline constexpr std::string_view kKXSEventNameKey = "eventName";
inline constexpr std::string_view kKXSEventParentUUIDKey = "parentUUID";

// Folders: archived and read, never transported.
inline constexpr std::string_view kKXSFolderNameKey = "KXSFolderNameKey";
inline constexpr std::string_view kKXSFolderParentUuidKey = "KXSFolderParentUuidKey";

// Assets.
inline constexpr std::string_view kKXSAssetRatingKey = "rating";
inline constexpr std::string_view kKXSAssetIsFlaggedKey = "isFlagged";
inline constexpr std::string_view kKXSAssetIsVideoKey = "isVideo";
inline constexpr std::string_view kKXSAssetCaptionKey = "caption";
inline constexpr std::string_view kKXSAssetEventUUIDKey = "eventUUID";
inline constexpr std::string_view kKXSAssetAdjustmentsKey = "adjustments";
inline constexpr std::string_view kKXSAssetExposureDateKey = "exposureDate";
inline constexpr std::string_view kKXSAssetModificationDateKey = "modificationDate";
inline constexpr std::string_view kKXSAssetLongitudeKey = "longitude";
inline constexpr std::string_view kKXSAssetLatitudeKey = "latitude";
inline constexpr std::string_view kKXSAssetOriginalFileNameKey = "originalFileName";
inline constexpr std::string_view kKXSAssetFacesKey = "faces";
inline constexpr std::string_view kKXSAssetPropertiesKey = "assetProperties";

// Face dictionaries.
inline constexpr std::string_view kKXSAssetFaceAlbumUUIDKey = "faceAlbumUUID";
inline constexpr std::string_view kKXSAssetFaceIndexKey = "faceIndex";
inline constexpr std::string_view kKXSAssetFaceRectangleKey = "faceRectangle";

// Asset properties and adjustments.
inline constexpr std::string_view kKXSAssetPropertiesImagePropertiesKey = "imageProperties";
inline constexpr std::string_view kKXSAssetPropertiesFilePropertiesKey = "fileProperties";
inline constexpr std::string_view kKXSAssetPropertiesFileNameKey = "fileName";
inline constexpr std::string_view kMQFileUTTypeKey = "MQFileUTType";
inline constexpr std::string_view kKXSImageAdjustmentsRotationKey = "rotation";

// Archived forms only.
inline constexpr std::string_view kKXSUUIDDataKey = "KXSUUIDDataKey";
inline constexpr std::string_view kKXSLibrarySnapshotUpdatesKey = "KXSLibrarySnapshotUpdatesKey";
inline constexpr std::string_view kKXSLibrarySnapshotDeletesKey = "KXSLibrarySnapshotDeletesKey";
inline constexpr std::string_view kKXSLibraryChangeSnapshotLibraryUUIDKey =
    "KXSLibraryChangeSnapshotLibraryUUIDKey";
inline constexpr std::string_view kKXSLibraryChangeSnapshotLibraryKindKey =
    "KXSLibraryChangeSnapshotLibraryKindKey";

}  // namespace kx
