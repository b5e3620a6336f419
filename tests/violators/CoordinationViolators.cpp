#include "tests/violators/CoordinationWrappers.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

using namespace violating;

void addLookUpsAndPieces(std::vector<Violator>& all) {
    Violators v("platform/InstallCoordinatorService.h", "*Coordination*");
    const std::string gives =
        "The coordinator of an application, whichever client created it: one of the kind when "
        "there is one, else, if asked for, a new one that `client` creates.";
    v.device<LookingCreates>("LookingCreates", gives);
    v.device<NothingWasCreated>("NothingWasCreated", gives);
    v.device<EverythingWasCreated>("EverythingWasCreated", gives);
    v.device<NothingIsAnError>(
        "NothingIsAnError",
        "No coordinator and no error when there is none and none was to be created.");
    const std::string stands =
        "An error when one of another kind stands in the way, when an update is wanted of what is "
        "not installed, or when the identifier is not legal (1 to 255 bytes of letters, digits, "
        "'.', '-', '_'; not \".\" or \"..\").";
    v.device<KindsDoNotMatter>("KindsDoNotMatter", stands);
    v.device<RefusalsWithoutAnError>("RefusalsWithoutAnError", stands);
    v.device<UpdatesNeedNothing>("UpdatesNeedNothing", stands);
    const std::string whatever =
        "The coordinator of an application, of whatever kind; null when there is none.";
    v.device<ForeignCoordinatorsAreHidden>("ForeignCoordinatorsAreHidden", whatever);
    v.device<OnlyFirstInstallsExist>("OnlyFirstInstallsExist", whatever);
    const std::string uninstalls = "Returns at once; the completion is called exactly once.";
    v.device<UninstallsCompleteTwice>("UninstallsCompleteTwice", uninstalls);
    v.device<UninstallsDoNotComplete>("UninstallsDoNotComplete", uninstalls);
    v.device<UninstallsOnTheCallersThread>("UninstallsOnTheCallersThread",
                                           "Called on a thread of the service's;");
    v.device<FailedUninstallsSucceed>("FailedUninstallsSucceed", "`error` is null on success.");
    v.device<UninstallsTakeTheApplicationToo>(
        "UninstallsTakeTheApplicationToo",
        "Uninstalls the application, or its placeholder where one covers it, without asking the "
        "person who uses the device.");
    const std::string person =
        "The error that a person may see: it says that an install did not come about, and holds "
        "the underlying error.";
    v.device<UnderlyingErrorsAreLost>("UnderlyingErrorsAreLost", person);
    v.device<PersonsErrorsHaveNoCode>("PersonsErrorsHaveNoCode", person);
    const std::string delegate =
        "From now on the delegate, held weakly, hears of every coordinator that one of the clients "
        "has created and that has no observer of its own:";
    v.device<DelegatesHearOfEverybody>("DelegatesHearOfEverybody", delegate);
    v.device<DelegatesHearNothing>("DelegatesHearNothing", delegate);
    v.device<RegistrationsDoNotEnd>("RegistrationsDoNotEnd",
                                    "It ends with the object: no call begins after that.");
    for (Violator& each : v.take()) all.push_back(std::move(each));
}

void addPromises(std::vector<Violator>& all) {
    Violators v("platform/InstallPromises.h", "*Coordination*");
    v.device<WithAsset<PromisesOfAnotherClient>>("PromisesOfAnotherClient", "Who has to keep it.");
    v.device<WithAsset<PromisesWithoutAName>>("PromisesWithoutAName",
                                              "A piece of an install that a client has promised");
    v.device<WithAsset<PromisesThatAreKeptAtOnce>>("PromisesThatAreKeptAtOnce",
                                                   "Whether it has been kept.");
    v.device<WithAsset<PercentOfOneHandle>>(
        "PercentOfOneHandle",
        "An object is a handle on the service's record: two handles on one promise show the same.");
    v.device<WithAsset<PercentOfAHundred>>("PercentOfAHundred", "From 0.0 to 1.0.");
    const std::string path = "Where the file lies, an absolute device path.";
    v.device<WithAsset<PathsAreForgotten>>("PathsAreForgotten", path);
    v.device<WithCoordinator<WithAttachedAsset<PathsAreNotSet>>>("PathsAreNotSet", path);
    v.device<WithCoordinator<WithAttachedAsset<KeepingIsLost>>>(
        "KeepingIsLost", "What waited for this promise goes on, on threads of the service's own.");
    v.device<WithCoordinator<WithAttachedAsset<ChangingAfterTheEnd>>>(
        "ChangingAfterTheEnd",
        "Nothing throws; a change of a promise that the service no longer has (its coordinator is "
        "done or cancelled) does nothing.");
    v.device<DataWithoutACancel>(
        "DataWithoutACancel",
        "Gives it up: the service no longer waits for it, and does not hold it against its "
        "keeper.");
    v.device<PackagesAreLeft>(
        "PackagesAreLeft",
        "Once the promise is complete and a coordinator or its placeholder has it, the file is the "
        "service's own, an icon's too: it reads it when it needs it and removes it afterwards (an "
        "icon may be left standing).");
    for (Violator& each : v.take()) all.push_back(std::move(each));
}

void addPlaceholders(std::vector<Violator>& all) {
    Violators v("platform/InstallPlaceholder.h", "*Coordination*");
    const std::string second =
        "A second set of the same piece replaces the first, until the configuration is complete; "
        "from then on every set is refused.";
    v.device<WithPlaceholder<CompletePlaceholdersTakeMore>>("CompletePlaceholdersTakeMore", second);
    v.device<WithPlaceholder<SecondPiecesAreRefused>>("SecondPiecesAreRefused", second);
    v.device<WithPlaceholder<NoMetadataIsRefused>>(
        "NoMetadataIsRefused", "Nothing is allowed, and says that there is no store metadata.");
    v.device<WithPlaceholder<ConfigurationsNeverComplete>>(
        "ConfigurationsNeverComplete",
        "Its configuration is complete when `setConfigurationComplete` has succeeded; once the "
        "coordinator has such a placeholder, the service puts it on the home screen.");
    v.device<WithCoordinator<ConfigurationsCompleteThemselves>>(
        "ConfigurationsCompleteThemselves",
        "One whose configuration never completes is kept and not shown.");
    v.device<WithPlaceholder<PlaceholdersAreNotGivenUp>>(
        "PlaceholdersAreNotGivenUp", "Gives it up: it never comes to stand on the home screen.");
    v.device<WithPlaceholder<VersionsOfPlaceholdersAreLost>>(
        "VersionsOfPlaceholdersAreLost",
        "What a placeholder tells of the application that is to come.");
    for (Violator& each : v.take()) all.push_back(std::move(each));
}

void addPieces(Violators& v) {
    v.device<WithCoordinator<WhoAsksIsTheCreator>>("WhoAsksIsTheCreator",
                                                   "The client that created it.");
    v.device<WithCoordinator<CoordinatorsAreNobodys>>(
        "CoordinatorsAreNobodys",
        "Nothing for a coordinator of which the service no longer knows whose it was.");
    const std::string asked =
        "Each piece is to be asked for before it is set: a second set is refused with an error, "
        "and the first stands.";
    v.device<WithCoordinator<NoOptionsAreThere>>("NoOptionsAreThere", asked);
    v.device<WithCoordinator<NoInitialAssetsAreThere>>("NoInitialAssetsAreThere", asked);
    v.device<WithCoordinator<NoUserDataIsThere>>("NoUserDataIsThere", asked);
    v.device<WithCoordinator<APlaceholderIsAlwaysThere>>("APlaceholderIsAlwaysThere", asked);
    v.device<WithCoordinator<SecondSetsSucceed>>("SecondSetsSucceed", asked);
    v.device<SecondSetsReplace>("SecondSetsReplace", asked);
    v.device<WithCoordinator<NobodyIsResponsible>>(
        "NobodyIsResponsible",
        "Whose task the package is where nobody has promised it; nothing when that is not said.");
    v.device<WithCoordinator<NullPlaceholdersAreTaken>>(
        "NullPlaceholdersAreTaken", "Refuses null, and the placeholder of another application.");
    v.device<WithCoordinator<EveryPlaceholderIsTaken>>(
        "EveryPlaceholderIsTaken", "Refuses null, and the placeholder of another application.");
    v.device<WithCoordinator<DataIsNotWaitedFor>>(
        "DataIsNotWaitedFor",
        "When the pieces that its kind needs are there and every promise is complete, the service "
        "installs on threads of its own, and the coordinator is gone afterwards.");
}

void addReports(Violators& v) {
    v.device<WithCoordinator<WithListener<PlaceholdersAreNotTold>>>(
        "PlaceholdersAreNotTold",
        "`coordinatorDidInstallPlaceholder:`: the placeholder stands on the home screen, or could "
        "not be put there: then the coordinator carries the error.");
    const std::string completes = "`coordinatorDidCompleteSuccessfully:`: the install has ended.";
    v.device<WithCoordinator<WithListener<CompletionsAreNotTold>>>("CompletionsAreNotTold",
                                                                   completes);
    v.device<WithCoordinator<WithListener<CompletionsAreToldTwice>>>("CompletionsAreToldTwice",
                                                                     completes);
    v.device<WithCoordinator<WithListener<CompletionsBeforePlaceholders>>>(
        "CompletionsBeforePlaceholders", completes);
    const std::string failed = "It failed when the coordinator carries an error.";
    v.device<WithCoordinator<WithListener<FailuresAreToldAsCancels>>>("FailuresAreToldAsCancels",
                                                                      failed);
    const std::string cancelled =
        "`coordinator:canceledWithReason:client:`: a client has cancelled it, or the service "
        "itself.";
    v.device<WithCoordinator<WithListener<CoordinatorCancelsAreNotTold>>>(
        "CoordinatorCancelsAreNotTold", cancelled);
    v.device<WithCoordinator<WithListener<CancelsOfAnotherClient>>>("CancelsOfAnotherClient",
                                                                    cancelled);
    v.device<WithCoordinator<WithListener<CancelsWithoutAReason>>>("CancelsWithoutAReason",
                                                                   cancelled);
    v.device<WithCoordinator<CoordinatorObserversAreOwned>>(
        "CoordinatorObserversAreOwned",
        "Who hears of this coordinator, held weakly; kept alive while it is being called.");
    v.device<EarlierObserversHearToo>("EarlierObserversHearToo",
                                      "One at a time: a later one takes the place of the earlier.");
}

void addEnds(Violators& v) {
    const std::string why =
        "Why it failed or was cancelled; nothing while it goes on and after a success.";
    v.device<WithCoordinator<ReportsOfAFailureThatIsNone>>("ReportsOfAFailureThatIsNone", why);
    v.device<WithCoordinator<ErrorsAreForgotten>>("ErrorsAreForgotten", why);
    v.device<WithCoordinator<SecondCancelsCount>>("SecondCancelsCount",
                                                  "A second cancel does nothing.");
    const std::string done =
        "On a coordinator that is done or cancelled every set is refused and every question is "
        "answered as when it ended.";
    v.device<WithCoordinator<CancelledCoordinatorsTakeMore>>("CancelledCoordinatorsTakeMore", done);
    v.device<WithCoordinator<CancelledCoordinatorsForget>>("CancelledCoordinatorsForget", done);
    v.device<CancelsRemoveTheVersion>(
        "CancelsRemoveTheVersion",
        "Ends it: its placeholder goes, its promises are given up, an installed version stays.");
}

}  // namespace

std::vector<Violator> coordinationViolators() {
    std::vector<Violator> all;
    addLookUpsAndPieces(all);
    addPromises(all);
    addPlaceholders(all);
    Violators v("platform/InstallCoordinator.h", "*Coordination*");
    addPieces(v);
    addReports(v);
    addEnds(v);
    for (Violator& each : v.take()) all.push_back(std::move(each));
    return all;
}

}  // namespace appsync
