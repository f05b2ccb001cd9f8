# What a client process and skein-host speak about an item's services. An endpoint reaches
# one service of one item; there is no message in it that names another. Names, identifiers
# and texts are bytes, never text. A null pointer is nil; an empty one is empty.
@0xe4b7a90d52c86f13;

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("skein::wire");

using Shares = import "shares.capnp";
using Types = import "types.capnp";

interface Services {
  serviceSources @0 (isIdentifier :Bool, target :Data)
      -> (names :List(Data), error :Types.Error);
  endpoint @1 (isIdentifier :Bool, target :Data, serviceName :Data)
      -> (endpoint :Endpoint, error :Types.Error);
}

# Made for one client, who may hand it on. Another one may connect as long as the first
# connection lives.
interface Endpoint {
  connect @0 () -> (connection :ServiceConnection, protocolName :Data, error :Types.Error);
}

# A connection is what it exports. A client that is done closes it; one that is gone has
# not, and that is how the extension tells them apart.
interface ServiceConnection {
  close @0 ();
}

# The client's ear for one request. `began` comes when the service gave a progress, before
# or after the reply; none comes when it gave none.
interface ProgressObserver {
  began @0 (progress :Progress, totalUnitCount :Int64, completedUnitCount :Int64);
  advanced @1 (completedUnitCount :Int64);
}
interface Progress {
  cancel @0 ();
}

# A share crosses without its root record's name: it is that of the connection's own item,
# and what a client writes there is not read.
interface Sharing extends(ServiceConnection) {
  fetchSharingInfo @0 () -> (shared :Bool, item :Types.Item, error :Types.Error);
  preflightCheckIfCurrentlyShareable @1 (observer :ProgressObserver)
      -> (shareable :Bool, item :Types.Item, items :List(Types.Item),
          otherItems :List(Types.Item), error :Types.Error);
  fetchParticipantListAndPublicPermission @2 (observer :ProgressObserver)
      -> (participants :List(Shares.Share.Participant), publicPermission :Int64, error :Types.Error);
  startPreparingForShare @3 (forcing :Bool);
  fetchShare @4 (observer :ProgressObserver) -> (share :Shares.Share, error :Types.Error);
  fetchShareURL @5 (observer :ProgressObserver) -> (url :Data, error :Types.Error);
  saveShare @6 (share :Shares.Share, observer :ProgressObserver) -> (share :Shares.Share, error :Types.Error);
  unshare @7 (observer :ProgressObserver) -> (error :Types.Error);
}

interface Collaboration extends(ServiceConnection) {
  # Which of the methods below the service has, by their selectors.
  selectors @0 () -> (selectors :List(Data));

  fetchVersionAndCapabilities @1 ()
      -> (version :UInt64, capabilities :UInt64, error :Types.Error);
  setEnvironmentType @2 (environmentType :UInt64);
  fetchCollaborationToken @3 (observer :ProgressObserver)
      -> (provider :Data, firstToken :Data, secondToken :Data, hasExpiry :Bool,
          expiry :Int64, error :Types.Error);
  fetchLatestRevision @4 (observer :ProgressObserver) -> (error :Types.Error);
  refreshSharingState @5 (observer :ProgressObserver) -> (error :Types.Error);
  fetchPrivacyState @6 (observer :ProgressObserver)
      -> (first :Bool, second :Bool, url :Data, error :Types.Error);
  documentIsInUse @7 (timeout :Float64);
  fetchFileProviderIdentifier @8 () -> (identifier :Data, error :Types.Error);
  fetchURLForSharingFile @9 () -> (url :Data, error :Types.Error);
  fetchFolderSharingState @10 (observer :ProgressObserver)
      -> (shared :Bool, error :Types.Error);
  fetchSharedFolderInfo @11 (observer :ProgressObserver)
      -> (shared :Bool, folderName :Data, error :Types.Error);
}
