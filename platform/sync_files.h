#pragma once

#include <string>
#include <string_view>

#include "platform/file_manager.h"

/// What a sync host and the application client exchange through the phone's file system: every
/// path, file and key that both sides must spell alike. Whoever writes another host needs this
/// header and the interfaces beside it.
///
/// Paths are the phone's own. All files are property lists, binary or XML, unless said otherwise;
/// each is replaced whole, so that nobody sees half of one. The client takes a missing, empty or
/// damaged file as absent unless said otherwise; a damaged one also gives a log line. One that it
/// cannot read just now it takes as absent for that call, says so, and leaves as it is, but for the
/// restore list. Keys that are not named here belong to the side that writes the file, and the
/// other passes them through.
namespace appsync::exchange {

// A desktop sync.

/// Where the host puts what it delivers. A SyncAsset's relative path is relative to this directory;
/// the packages lie here until they are installed, and the host takes away what is left.
inline constexpr std::string_view StagingRoot = "/var/mobile/Media/PublicStaging";

/// The host fills this directory before SyncClient::reconcileSync, the todo list last: the todo
/// list, the icon layout, and for each application to install a directory with its identifier as
/// name that holds the bundle's Info.plist and icon, and the package's metadata and artwork.
/// Missing: nothing to do.
inline constexpr std::string_view StagingArea = "/var/mobile/Media/PublicStaging/ApplicationSync";

/// All state of the sync. The client makes it, and removes it in SyncClient::clearSyncData.
inline constexpr std::string_view SyncRoot = "/var/mobile/Library/ApplicationSync";

/// Where the client moves the staging area; the one of the sync before is removed first. Paths in
/// it begin with the first of the two.
inline constexpr std::string_view InWorkArea = "/var/mobile/Library/ApplicationSync/HalvoStuff/";
inline constexpr std::string_view WorkArea = InWorkArea.substr(0, InWorkArea.size() - 1);

/// In the staging area, later in the work area: an array with a dictionary for each application, in
/// the order of the desktop's wishes. The host writes it; the client then records in it how far
/// each application has got. Of two entries with one identifier the first counts.
inline constexpr std::string_view TodoListName = "ApplicationsSync.plist";
inline constexpr std::string_view TodoIdentifierKey = "identifier";  ///< string, required
inline constexpr std::string_view TodoOperationKey = "operation";    ///< string, below
inline constexpr std::string_view TodoVersionKey = "version";        ///< string, optional
inline constexpr std::string_view TodoNameKey = "name";              ///< string to show, optional

// Operations. The host writes the first two; an entry is finished when its operation is one of the
// last two, and pending with any other.
inline constexpr std::string_view TodoInstall = "install";        ///< install or update
inline constexpr std::string_view TodoRemove = "remove";          ///< done while reconciling
inline constexpr std::string_view TodoDownloaded = "DOWNLOADED";  ///< the package has arrived
inline constexpr std::string_view TodoSent = "SENT";              ///< sent, with nothing to install
inline constexpr std::string_view TodoInstalled = "INSTALLED";
inline constexpr std::string_view TodoFailed = "FAILED";

/// In the staging area: the home screen's layout that the desktop wants, handed to the home screen
/// as it stands. Missing or empty: the home screen keeps its own.
inline constexpr std::string_view IconLayoutFormat = "%@/DashelIconState.plist";  ///< of the area
inline constexpr std::string_view IconLayoutName =
    IconLayoutFormat.substr(IconLayoutFormat.find('/') + 1);

/// An array of identifiers: the applications that were on the phone when the last sync ended. The
/// host writes it after a successful end; the client reads it in SyncClient::installedAssets and
/// removes it at the next successful end. Missing: nothing counts as deleted since then.
inline const std::string LastSyncState = joinPath(SyncRoot, "LastSyncAppState.plist");

// A restore.

/// The applications of the backup: a dictionary from identifier to a dictionary with the keys
/// below. The host writes it last of all that a restore needs, before
/// SyncClient::reconcileRestoreOfType; the client moves it aside when it has made the placeholders,
/// also when it is damaged or cannot be read.
inline constexpr std::string_view RestoreList =
    "/var/mobile/Media/HalvoRestore/RestoreApplications.plist";
/// Data, required: the application's metadata, a property list of its own.
inline constexpr std::string_view RestoreMetadataKey = "HalvoMetadata";
/// Data, optional: an opaque blob, handed on as it is.
inline constexpr std::string_view RestoreSinfKey = "ApplicationSINF";
/// Data, optional: the placeholder's icon, a PNG.
inline constexpr std::string_view RestoreIconKey = "PlaceholderIcon";

/// The applications that are to stay placeholders until the person asks for them: a dictionary with
/// the two arrays of identifiers below; the automatic one wins. The host writes it before the
/// restore list.
inline constexpr std::string_view DemotedApplications =
    "/var/mobile/Library/Preferences/com.corvane.Safekeep.DemotedApps.plist";
inline constexpr std::string_view AutomaticDowngradesKey = "AutomaticDowngrades";
inline constexpr std::string_view IntentionalDowngradesKey = "IntentionalDowngrades";

/// A directory with the identifier as name for each application whose data a restore has still to
/// give back; written by the phone for the host, taken by the application's install.
inline constexpr std::string_view WaitingData = "/var/mobile/Media/HalvoRestore/Data";

/// Packages of a restore that were received before their application's data: a dictionary from
/// identifier to a dictionary from version to a dictionary with the key below. The client alone
/// writes it; the host reads which packages it must leave where they are. Damaged: the client
/// removes it when an application's entry is to go.
inline const std::string RestoreState = joinPath(SyncRoot, "RestoreState.plist");
/// String: where the package lies.
inline constexpr std::string_view RestorePathKey = "path";

/// Where the packages of a restore lie, and those that a store brings.
inline constexpr std::string_view Downloads = "/var/mobile/Media/Downloads";

// An application's own files, in its container, in its directory of the staging area, and beside
// the bundle in a package.

/// The store's metadata: a dictionary.
inline constexpr std::string_view MetadataName = "HalvoMetadata.plist";
/// An icon for when the bundle gives none: a picture.
inline constexpr std::string_view ArtworkName = "HalvoArtwork";

}  // namespace appsync::exchange
