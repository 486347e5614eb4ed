// Movies that are saved to the user's library.

#include <utility>

#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

class Save : public DaemonWorld {
protected:
    static constexpr std::string_view kSaved =
        "LCRecordingManager:saveVideoToCameraRoll: Video saved to camera roll successful";
    static constexpr std::string_view kFailed =
        "LCRecordingManager:saveVideoToCameraRoll: Video saved to camera roll failed";

    /// A client with a recording that has been stopped, and its movie.
    std::unique_ptr<TestClient> makeStopped(URL& movie) {
        auto client = makeRecording();
        advance(std::chrono::seconds(3));
        client->ask(DaemonMessage::StopRecording);
        settle();
        movie = URL::file(pathOf("Player"));
        EXPECT_TRUE(fakes_.fileSystem.exists(movie.path()));
        fakes_.logSink.clear();
        return client;
    }
    Array saves() {
        Array saves;
        EXPECT_TRUE(fakes_.admin.ask([&](const Dictionary& state) {
            const Value* entry = state.find("saves");
            if (const Array* list = entry ? entry->as<Array>() : nullptr) saves = *list;
        }));
        settle();
        return saves;
    }
    Dictionary command(const std::string& line) {
        Dictionary result;
        EXPECT_TRUE(fakes_.admin.command(line, [&](Dictionary answer) { result = std::move(answer); }));
        settle();
        return result;
    }
};

TEST_F(Save, AMovieIsMixedAddedToItsUsersLibraryAndRemoved) {
    URL movie;
    const auto client = makeStopped(movie);
    const auto asked = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    settle();
    ASSERT_EQ(asked->answers, 1);
    EXPECT_EQ(asked->code(), 0);
    const auto assets = fakes_.photoLibrary.assets();
    ASSERT_EQ(assets.size(), 1u);
    EXPECT_NE(assets[0].movie.text().find("//LCLuma_Final"), std::string::npos);
    EXPECT_EQ(assets[0].user, FakeIpc::kUser);
    EXPECT_NEAR(assets[0].content->duration().seconds(), 3, 0.2);
    EXPECT_TRUE(fakes_.fileSystem.files().empty()) << "the mixed movie and the given one have gone";
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{"LCRecordingManager: saveVideoToCameraRoll:", std::string(kSaved)}));
}

TEST_F(Save, AFailedMixIsLoggedAndTheMovieSavedAsItIs) {
    URL movie;
    const auto client = makeStopped(movie);
    fakes_.faults.failNext("MovieExporter.export");
    const auto asked = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    settle();
    EXPECT_EQ(asked->code(), 0);
    ASSERT_EQ(fakes_.photoLibrary.assets().size(), 1u);
    EXPECT_EQ(fakes_.photoLibrary.assets()[0].movie, movie);
    EXPECT_FALSE(fakes_.fileSystem.exists(movie.path()));
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"Error Mixing video Audio tracks", "LCRecordingManager: saveVideoToCameraRoll:",
                     std::string(kSaved)}));
}

TEST_F(Save, AFailedLibraryIsToldAndTheFilesGoAllTheSame) {
    URL movie;
    const auto client = makeStopped(movie);
    fakes_.faults.failNext("PhotoLibrary.addVideo");
    const auto asked = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    settle();
    ASSERT_EQ(asked->answers, 1);
    EXPECT_EQ(asked->code(), -5812);
    EXPECT_TRUE(fakes_.fileSystem.files().empty());
    EXPECT_EQ(fakes_.logSink.logged(), (Lines{"LCRecordingManager: saveVideoToCameraRoll:", std::string(kFailed)}));
}

TEST_F(Save, WithoutAMovieNothingIsRemovedAndItFails) {
    URL movie;
    const auto client = makeStopped(movie);
    const auto asked = client->ask(DaemonMessage::SaveVideoToCameraRoll, {Value()});
    settle();
    ASSERT_EQ(asked->answers, 1);
    EXPECT_EQ(asked->code(), -5812);
    EXPECT_TRUE(fakes_.fileSystem.exists(movie.path()));
    EXPECT_EQ(fakes_.logSink.logged(),
              (Lines{"Error Mixing video Audio tracks", "LCRecordingManager: saveVideoToCameraRoll:",
                     std::string(kFailed)}));
}

TEST_F(Save, AUsersOwnMovieElsewhereIsSavedAndRemovedAndNobodyElses) {
    URL movie;
    const auto client = makeStopped(movie);
    fakes_.fileSystem.addUsersFile(FakeIpc::kUser, "/home/me/own.mp4", 10);
    fakes_.fileSystem.addUsersFile(UserID{1001}, "/home/you/yours.mp4", 10);
    const auto yours = client->ask(DaemonMessage::SaveVideoToCameraRoll, {URL("file:///home/you/yours.mp4")});
    settle();
    ASSERT_EQ(yours->answers, 1);
    EXPECT_EQ(yours->code(), -5812);
    EXPECT_TRUE(fakes_.fileSystem.isThere("/home/you/yours.mp4"));
    EXPECT_TRUE(fakes_.photoLibrary.assets().empty());
    const auto own = client->ask(DaemonMessage::SaveVideoToCameraRoll, {URL("file:///home/me/own.mp4")});
    settle();
    EXPECT_EQ(own->code(), 0) << "not a movie that can be mixed, so it is added as it is";
    EXPECT_FALSE(fakes_.fileSystem.isThere("/home/me/own.mp4"));
    ASSERT_EQ(fakes_.photoLibrary.assets().size(), 1u);
    EXPECT_EQ(fakes_.photoLibrary.assets()[0].movie, URL("file:///home/me/own.mp4"));
}

TEST_F(Save, AnotherUsersOwnMovieIsNotReadWithTheDaemonsRights) {
    URL movie;
    const auto client = makeStopped(movie);
    constexpr UserID kOther{1001};
    fakes_.ipc.setUser(ProcessID{500}, kOther);
    fakes_.fileSystem.addUsersFile(kOther, "/home/me/own.mp4", 10);
    bool wasOpened = false;
    fakes_.movieExporters.setWhenOpened([&](const URL&) { wasOpened = true; });
    const auto own = client->ask(DaemonMessage::SaveVideoToCameraRoll, {URL("file:///home/me/own.mp4")});
    settle();
    EXPECT_EQ(own->code(), 0);
    EXPECT_FALSE(wasOpened);
    EXPECT_EQ(fakes_.photoLibrary.assets().size(), 1u);
    EXPECT_FALSE(fakes_.fileSystem.isThere("/home/me/own.mp4"));
    // What was recorded here is.
    client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    settle();
    EXPECT_TRUE(wasOpened);
}

TEST_F(Save, APathThatLeavesTheTemporaryDirectoryIsNoTemporaryFile) {
    URL movie;
    const auto client = makeStopped(movie);
    const std::string directory = process_->tempStore()._srTempPath();
    for (const std::string& path : {directory + "../x.mp4", directory + "..", directory + "a/b.mp4", directory,
                                    std::string("/etc/passwd"), std::string()}) {
        const auto asked = client->ask(DaemonMessage::SaveVideoToCameraRoll, {URL::file(path)});
        settle();
        EXPECT_EQ(asked->answers, 1) << path;
        EXPECT_EQ(asked->code(), -5812) << path;
    }
    EXPECT_TRUE(fakes_.photoLibrary.assets().empty());
    EXPECT_TRUE(fakes_.movieExporters.presets().empty());
    EXPECT_TRUE(fakes_.fileSystem.exists(movie.path()));
}

TEST_F(Save, TheMovieOfALaterRecordingWithTheSameNameStays) {
    URL movie;
    const auto client = makeStopped(movie);
    const auto asked = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    client->start();
    settle();
    advance(std::chrono::seconds(2));
    EXPECT_EQ(asked->answers, 1);
    EXPECT_TRUE(fakes_.fileSystem.exists(movie.path()));
    const auto stopped = client->ask(DaemonMessage::StopRecording);
    settle();
    EXPECT_EQ(stopped->answers, 1);
    EXPECT_NEAR(fakes_.fileSystem.movie(movie.path())->duration().seconds(), 2, 0.2);
}

TEST_F(Save, ARecordingThatTakesTheMoviesPlaceWhileItIsMixedIsNeitherRemovedNorAdded) {
    for (const bool mixingFails : {false, true}) {
        URL movie;
        const auto client = makeStopped(movie);
        bool isFirst = true;
        fakes_.movieExporters.setWhenOpened([&](const URL&) {
            if (!std::exchange(isFirst, false)) return;
            client->start();
            (void)fakes_.scheduler.semaphore(0)->waitFor(std::chrono::seconds(2));  // it records by then
        });
        if (mixingFails) fakes_.faults.failNext("MovieExporters.openMovie");
        const auto asked = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
        settle();
        advance(std::chrono::seconds(4));
        EXPECT_EQ(asked->answers, 1);
        ASSERT_TRUE(session(*client)->isRecording());
        EXPECT_TRUE(fakes_.fileSystem.exists(movie.path())) << "it is the newer one's";
        for (const auto& asset : fakes_.photoLibrary.assets())
            EXPECT_TRUE(asset.content && asset.content->finished) << asset.movie.path();
        const auto stopped = client->ask(DaemonMessage::StopRecording);
        settle();
        ASSERT_TRUE(stopped->url(0));
        EXPECT_TRUE(fakes_.fileSystem.exists(stopped->url(0)->path()));
        client->connection.reset();
        client->die();
        settle();
    }
}

TEST_F(Save, AMovieThatTookThePlaceIsNobodyElsesWhenItsClientHasGoneTooMeanwhile) {
    URL movie;
    const auto client = makeStopped(movie);
    const auto goOn = std::shared_ptr<Semaphore>(fakes_.scheduler.semaphore(0));
    fakes_.movieExporters.setWhenOpened([goOn](const URL&) { goOn->wait(); });
    fakes_.faults.failNext("MovieExporters.openMovie");
    client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    settle();
    client->start();
    settle();
    advance(std::chrono::seconds(2));
    const auto stopped = client->ask(DaemonMessage::StopRecording);
    settle();
    ASSERT_TRUE(stopped->url(0));
    ASSERT_EQ(*stopped->url(0), movie) << "the same name";
    client->connection.reset();
    client->die();
    settle();
    goOn->signal();
    settle();
    const Array list = saves();
    ASSERT_EQ(list.size(), 1u);
    EXPECT_EQ(*list[0].as<Dictionary>()->find("state"), Value("failed"));
    EXPECT_TRUE(fakes_.photoLibrary.assets().empty()) << "nobody has asked for this one to be saved";
    ASSERT_TRUE(fakes_.fileSystem.movie(movie.path()));
    EXPECT_NEAR(fakes_.fileSystem.movie(movie.path())->duration().seconds(), 2, 0.2);
    EXPECT_EQ(process_->tempStore().claimedPathCount(), 0u) << "what was remembered is forgotten with the save";
}

TEST_F(Save, AMovieThatIsBeingRecordedIsRefusedAndGoesOn) {
    URL movie;
    const auto client = makeStopped(movie);
    client->start();
    settle();
    advance(std::chrono::seconds(2));
    const auto asked = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    // The same file under another name.
    const std::string path = movie.path();
    const auto doubled = client->ask(DaemonMessage::SaveVideoToCameraRoll,
                                     {URL::file(path.substr(0, path.rfind('/')) + "//Player.mp4")});
    EXPECT_TRUE(command("save " + movie.text()).find("error"));
    settle();
    EXPECT_EQ(asked->code(), -5812);
    EXPECT_EQ(doubled->code(), -5812);
    EXPECT_TRUE(fakes_.photoLibrary.assets().empty());
    const auto stopped = client->ask(DaemonMessage::StopRecording);
    settle();
    ASSERT_EQ(stopped->answers, 1);
    ASSERT_TRUE(fakes_.fileSystem.movie(path));
    EXPECT_NEAR(fakes_.fileSystem.movie(path)->duration().seconds(), 2, 0.2);
    const auto saved = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    settle();
    EXPECT_EQ(saved->code(), 0);
}

TEST_F(Save, TwoSavesOfOneSecondAreAnsweredBothAndRemoveBothMovies) {
    URL movie;
    const auto client = makeStopped(movie);
    const auto first = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    const auto second = client->ask(DaemonMessage::SaveVideoToCameraRoll, {movie});
    settle();
    EXPECT_EQ(first->answers, 1);
    EXPECT_EQ(second->answers, 1);
    EXPECT_TRUE(fakes_.fileSystem.files().empty());
    EXPECT_GE(fakes_.photoLibrary.assets().size(), 1u);
}

TEST_F(Save, TheAdministratorSavesAMovieAndSeesHowItGoes) {
    URL movie;
    const auto client = makeStopped(movie);
    for (const std::string line : {"save file:///nowhere.mp4", "save", "save file:///a%2", "save x", "save file://a b"})
        EXPECT_TRUE(command(line).find("error")) << line;
    const std::string path = movie.path();
    const Dictionary answer = command("save file://" + path.substr(0, path.size() - 4) + "%2Emp4");
    ASSERT_TRUE(answer.find("save"));
    EXPECT_EQ(*answer.find("save"), Value(std::uint64_t{1}));
    settle();
    const Array list = saves();
    ASSERT_EQ(list.size(), 1u);
    const Dictionary& entry = *list[0].as<Dictionary>();
    EXPECT_EQ(*entry.find("movie"), Value(path));
    EXPECT_EQ(*entry.find("state"), Value("saved"));
    EXPECT_EQ(*entry.find("progress"), Value(1.0));
    EXPECT_EQ(*entry.find("savedAs"), Value("/library/1.mp4"));
}

TEST_F(Save, OfFinishedSavesTheLastSixteenStay) {
    URL movie;
    const auto client = makeStopped(movie);
    for (int i = 0; i < 20; ++i) {
        client->ask(DaemonMessage::SaveVideoToCameraRoll, {Value()});
        settle();
    }
    ASSERT_EQ(saves().size(), 16u);
    EXPECT_EQ(*saves()[0].as<Dictionary>()->find("number"), Value(std::uint64_t{5}));
    EXPECT_EQ(*saves()[0].as<Dictionary>()->find("state"), Value("failed"));
}

}  // namespace
}  // namespace lumacast
