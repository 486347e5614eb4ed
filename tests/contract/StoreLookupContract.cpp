#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <mutex>
#include <thread>

#include "linux/store/LinuxStoreLookup.h"
#include "linux/store/ProgramOutput.h"
#include "linux/system/LinuxEnvironment.h"
#include "support/ThreadScheduler.h"
#include "tests/contract/HeardSound.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakeStoreLookup.h"
#include "tests/fakes/ThreadLoop.h"

namespace lumacast {
namespace {

using Products = std::vector<StoreProduct>;

StoreRequest requestFor(std::vector<std::string> identifiers, int localizationStyle = 1) {
    return {StoreRequest::KeyProfile::Product, localizationStyle, std::move(identifiers)};
}

Products productsOf(StoreLookup& lookup, const StoreRequest& request) {
    const auto answer = std::make_shared<std::promise<Products>>();
    auto products = answer->get_future();
    lookup.start(request, [answer](const Products& found) { answer->set_value(found); });
    if (products.wait_for(std::chrono::seconds(60)) != std::future_status::ready) {
        ADD_FAILURE() << "the handler was not called";
        return {};
    }
    return products.get();
}

/// A catalogue's entry, in English and what `more` says.
std::string component(const std::string& id, const std::string& name, const std::string& more = "") {
    return "<component type=\"desktop-application\"><id>" + id + "</id><pkgname>x</pkgname><name>" + name +
           "</name><summary>It is one</summary>" + more + "</component>\n";
}
std::string catalog(const std::string& components) {
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<components version=\"0.14\" origin=\"test\">\n" + components +
           "</components>\n";
}

class StoreLookupWorld {
public:
    virtual ~StoreLookupWorld() = default;
    virtual StoreLookup& store() = 0;
    virtual void add(const std::string& identifier, const std::string& name) = 0;
    /// One that says everything: developer, homepage, the genre "Utilities".
    virtual void addWhole(const std::string& identifier, const std::string& name, const std::string& developer,
                          const std::string& link) = 0;
};

class FakeStoreLookupWorld final : public StoreLookupWorld {
public:
    StoreLookup& store() override { return store_; }
    void add(const std::string& identifier, const std::string& name) override {
        StoreProduct product;
        product.displayName = name;
        store_.add(identifier, product);
    }
    void addWhole(const std::string& identifier, const std::string& name, const std::string& developer,
                  const std::string& link) override {
        store_.add(identifier, {name, developer, link, std::vector<std::string>{"Utilities"}});
    }

private:
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    FaultPlan faults_;
    FakeStoreLookup store_{scheduler_, faults_};
};

LinuxStoreLookup::Options optionsFor(const ScratchDirectory& catalogs) {
    return {LC_CATALOG_PROGRAM,
            {"HOME=" + catalogs.path(), "XDG_CACHE_HOME=" + catalogs.path("cache"), "LC_ALL=C.UTF-8"},
            "en",
            {catalogs.path()},
            std::chrono::seconds(60)};
}

class PortStoreLookupWorld final : public StoreLookupWorld {
public:
    StoreLookup& store() override { return store_; }
    void add(const std::string& identifier, const std::string& name) override { write(component(identifier, name)); }
    void addWhole(const std::string& identifier, const std::string& name, const std::string& developer,
                  const std::string& link) override {
        write(component(identifier, name,
                        "<developer_name>" + developer + "</developer_name><url type=\"homepage\">" + link +
                            "</url><categories><category>Utility</category></categories>"));
    }

private:
    void write(const std::string& added) {
        components_ += added;
        catalogs_.write("xml/test.xml", catalog(components_));
    }

    std::string components_;
    ScratchDirectory catalogs_;
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
    LinuxStoreLookup store_{scheduler_, optionsFor(catalogs_)};
};

using Maker = std::function<std::unique_ptr<StoreLookupWorld>()>;

class StoreLookupContract : public ::testing::TestWithParam<Maker> {
protected:
    Products find(std::vector<std::string> identifiers) {
        return productsOf(world_->store(), requestFor(std::move(identifiers)));
    }
    std::unique_ptr<StoreLookupWorld> world_ = GetParam()();
};

TEST_P(StoreLookupContract, AProductIsWhatTheStoreSays) {
    world_->addWhole("com.example.Clock", "Clock", "Example Arts", "https://clock.example/");
    const Products found = find({"com.example.Clock"});
    ASSERT_EQ(found.size(), 1u);
    EXPECT_EQ(found[0].displayName, "Clock");
    EXPECT_EQ(found[0].artistName, "Example Arts");
    EXPECT_EQ(found[0].shortProductURL, "https://clock.example/");
    EXPECT_EQ(found[0].genreNames, std::vector<std::string>{"Utilities"});
}

TEST_P(StoreLookupContract, WhatTheStoreDoesNotSayIsNone) {
    world_->add("com.example.Clock", "Clock");
    const Products found = find({"com.example.Clock"});
    ASSERT_EQ(found.size(), 1u);
    EXPECT_EQ(found[0].displayName, "Clock");
    EXPECT_EQ(found[0].artistName, std::nullopt);
    EXPECT_EQ(found[0].genreNames, std::nullopt);
}

TEST_P(StoreLookupContract, WhatTheStoreDoesNotHaveIsNotFound) {
    EXPECT_TRUE(find({"com.example.Clock"}).empty());
    world_->add("com.example.Clock", "Clock");
    EXPECT_TRUE(find({"com.example.Cloc"}).empty());
    EXPECT_TRUE(find({}).empty());
}

TEST_P(StoreLookupContract, EachIdentifierFindsItsOwn) {
    world_->add("com.example.Clock", "Clock");
    world_->add("com.example.Watch", "Watch");
    world_->add("com.example.Sundial", "Sundial");
    const Products found = find({"com.example.Watch", "com.example.Nothing", "com.example.Clock"});
    ASSERT_EQ(found.size(), 2u);
    std::vector<std::string> names{found[0].displayName.value_or(""), found[1].displayName.value_or("")};
    std::sort(names.begin(), names.end());
    EXPECT_EQ(names, (std::vector<std::string>{"Clock", "Watch"}));
}

TEST_P(StoreLookupContract, TheHandlerIsCalledOnceAndNeverInline) {
    const auto calls = std::make_shared<std::atomic<int>>(0), inlineCalls = std::make_shared<std::atomic<int>>(0);
    const std::thread::id caller = std::this_thread::get_id();
    for (int i = 0; i < 3; ++i)
        world_->store().start(requestFor({"com.example.Clock"}), [=](const Products&) {
            ++*calls;
            if (std::this_thread::get_id() == caller) ++*inlineCalls;
        });
    EXPECT_TRUE(eventually([&] { return *calls == 3; }));
    find({"com.example.Clock"});
    EXPECT_EQ(*calls, 3);
    EXPECT_EQ(*inlineCalls, 0);
}

INSTANTIATE_TEST_SUITE_P(Fake, StoreLookupContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeStoreLookupWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, StoreLookupContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortStoreLookupWorld>(); })));

class LinuxStoreLookupTest : public ::testing::Test {
protected:
    Products find(const StoreRequest& request) {
        LinuxStoreLookup store(scheduler_, options_);
        return productsOf(store, request);
    }
    std::string nameOf(const std::string& identifier, int localizationStyle = 1) {
        const Products found = find(requestFor({identifier}, localizationStyle));
        return found.size() == 1 ? found[0].displayName.value_or("none") : std::to_string(found.size()) + " found";
    }
    void write(const std::string& components) { scratch_.write("xml/test.xml", catalog(components)); }
    /// A program in the place of the one that reads catalogues.
    void useScript(const std::string& text) {
        options_.program = scratch_.write("script", "#!/bin/sh\n" + text + "\n");
        std::filesystem::permissions(options_.program, std::filesystem::perms::owner_all);
    }

    ScratchDirectory scratch_;
    LinuxStoreLookup::Options options_ = optionsFor(scratch_);
    ThreadScheduler scheduler_{std::make_shared<ThreadLoop>()};
};

TEST_F(LinuxStoreLookupTest, NamesAreInTheUsersLanguage) {
    write(component("com.example.Clock", "Clock",
                    "<name xml:lang=\"de\">Uhr</name><name xml:lang=\"pt_BR\">Relógio</name>"
                    "<developer_name>Arts</developer_name><developer_name xml:lang=\"de\">Kunst</developer_name>"));
    EXPECT_EQ(nameOf("com.example.Clock"), "Clock");
    options_.locale = "de_AT";
    EXPECT_EQ(nameOf("com.example.Clock"), "Uhr");
    EXPECT_EQ(find(requestFor({"com.example.Clock"})).at(0).artistName, "Kunst");
    EXPECT_EQ(nameOf("com.example.Clock", 0), "Clock");
    options_.locale = "pt_BR";
    EXPECT_EQ(nameOf("com.example.Clock"), "Relógio");
    options_.locale = "fr_FR";
    EXPECT_EQ(nameOf("com.example.Clock"), "Clock");
}

TEST_F(LinuxStoreLookupTest, AnApplicationIsFoundByWhateverNamesItsEntry) {
    write(component("com.example.Clock.desktop", "Clock") + component("com.example.Watch", "Watch") +
          component("com.example.Dial", "Dial", "<launchable type=\"desktop-id\">dial.desktop</launchable>") +
          component("com.example.New", "New", "<provides><id>com.example.Old</id></provides>"));
    EXPECT_EQ(nameOf("com.example.Clock"), "Clock");
    EXPECT_EQ(nameOf("com.example.Clock.desktop"), "Clock");
    EXPECT_EQ(nameOf("com.example.Watch.desktop"), "Watch");
    EXPECT_EQ(nameOf("dial"), "Dial");
    EXPECT_EQ(nameOf("dial.desktop"), "Dial");
    EXPECT_EQ(nameOf("com.example.Old"), "New");
}

TEST_F(LinuxStoreLookupTest, TheLinkIsTheHomepageOnTheWebOrTheSoftwareCentres) {
    write(component("a", "A",
                    "<url type=\"homepage\">http://a.example/</url><url type=\"bugtracker\">https://b.example/</url>") +
          component("b", "B", "<url type=\"bugtracker\">https://b.example/</url>") +
          component("c", "C", "<url type=\"homepage\">file:///etc/passwd</url>"));
    EXPECT_EQ(find(requestFor({"a"})).at(0).shortProductURL, "http://a.example/");
    EXPECT_EQ(find(requestFor({"b"})).at(0).shortProductURL, "appstream:b");
    EXPECT_EQ(find(requestFor({"c"})).at(0).shortProductURL, "appstream:c");
}

TEST_F(LinuxStoreLookupTest, GenresAreTheMainCategoriesOrAsTheyAreWritten) {
    write(component("a", "A", "<categories><category>Graphics</category><category>2DGraphics</category></categories>") +
          component("b", "B", "<categories><category>X-Unheard</category></categories>"));
    EXPECT_EQ(find(requestFor({"a"})).at(0).genreNames, std::vector<std::string>{"Graphics & Photography"});
    EXPECT_EQ(find(requestFor({"b"})).at(0).genreNames, std::vector<std::string>{"X-Unheard"});
}

TEST_F(LinuxStoreLookupTest, CataloguesInYamlCountToo) {
    scratch_.write("yaml/test.yml",
                   "---\nFile: DEP-11\nVersion: '0.14'\nOrigin: test\n---\nType: desktop-application\n"
                   "ID: com.example.Clock\nPackage: x\nName:\n  C: Clock\nSummary:\n  C: It is one\n");
    EXPECT_EQ(nameOf("com.example.Clock"), "Clock");
}

TEST_F(LinuxStoreLookupTest, ABrokenCatalogueTakesNothingFromTheOthers) {
    write(component("com.example.Clock", "Clock"));
    scratch_.write("xml/broken.xml", "<components><component><id>com.example.Watch</id");
    scratch_.write("xml/noise.xml.gz", "\x1f\x8b nothing of the kind");
    scratch_.write("yaml/broken.yml", "---\n\t{[: \xff\n");
    EXPECT_EQ(nameOf("com.example.Clock"), "Clock");
    EXPECT_EQ(nameOf("com.example.Watch"), "0 found");
}

TEST_F(LinuxStoreLookupTest, WhatIsNoIdentifierIsNotAskedFor) {
    const std::string heard = scratch_.path("heard");
    useScript("for word; do echo \"$word\"; done >" + heard + "; echo '[]'");
    find(requestFor(
        {"", "-x-is-allowed", std::string(256, 'a'), "a b", "a\nb", "../x", "\xc3\xa4", std::string("a\0b", 3)}));
    EXPECT_EQ(ScratchDirectory::read(heard), "--locale\nen\n--catalog\n" + scratch_.path() + "\n--\n-x-is-allowed\n");
    find(requestFor(std::vector<std::string>(100, "a")));
    const std::string asked = ScratchDirectory::read(heard);
    EXPECT_EQ(std::count(asked.begin(), asked.end(), '\n'), 5 + 64);
    std::filesystem::remove(heard);
    EXPECT_TRUE(find(requestFor({"a/b"})).empty());
    EXPECT_FALSE(std::filesystem::exists(heard));
}

TEST_F(LinuxStoreLookupTest, AProgramThatDoesNotDoItsWorkFindsNothing) {
    for (const char* text : {"echo '[{\"name\":\"Clock\"}]'; exit 1", "echo '[{\"name\":\"Clock\"}'", "kill -KILL $$",
                             "yes '[{\"name\":\"Clock\"}]'", "echo '{\"name\":\"Clock\"}'", "echo '[7, null, []]'"}) {
        useScript(text);
        EXPECT_TRUE(find(requestFor({"a"})).empty()) << text;
    }
    options_.program = scratch_.path("missing");
    EXPECT_TRUE(find(requestFor({"a"})).empty());
    options_.program = "";
    EXPECT_TRUE(find(requestFor({"a"})).empty());
    useScript("echo '[{\"name\":\"Clock\", \"developer\":7, \"link\":\"\", \"genres\":[1, \"Fun\"]}]'");
    const Products found = find(requestFor({"a"}));
    ASSERT_EQ(found.size(), 1u);
    EXPECT_EQ(found[0].displayName, "Clock");
    EXPECT_EQ(found[0].artistName, std::nullopt);
    EXPECT_EQ(found[0].shortProductURL, std::nullopt);
    EXPECT_EQ(found[0].genreNames, std::vector<std::string>{"Fun"});
}

TEST_F(LinuxStoreLookupTest, AProgramThatHangsIsEndedWithItsPatience) {
    const std::string number = scratch_.path("number");
    useScript("echo $$ >" + number + "; exec sleep 60");
    options_.patience = std::chrono::milliseconds(500);
    const auto before = std::chrono::steady_clock::now();
    EXPECT_TRUE(find(requestFor({"a"})).empty());
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(20));
    EXPECT_FALSE(std::filesystem::exists("/proc/" + std::to_string(std::stoi(ScratchDirectory::read(number)))));
    // Also one that says goodbye and stays.
    useScript("echo '[{\"name\":\"Clock\"}]'; exec >/dev/null sleep 60");
    EXPECT_TRUE(find(requestFor({"a"})).empty());
}

TEST_F(LinuxStoreLookupTest, ItsEndEndsTheLookupAndCallsEveryHandler) {
    useScript("exec sleep 60");
    const auto calls = std::make_shared<std::atomic<int>>(0);
    const auto before = std::chrono::steady_clock::now();
    {
        LinuxStoreLookup store(scheduler_, options_);
        for (int i = 0; i < 40; ++i)
            store.start(requestFor({"a"}), [calls](const Products& found) {
                EXPECT_TRUE(found.empty());
                ++*calls;
            });
    }
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(5));
    EXPECT_TRUE(eventually([&] { return *calls == 40; }));
}

TEST_F(LinuxStoreLookupTest, NoMoreThanThirtyTwoWait) {
    const std::string runs = scratch_.path("runs"), go = scratch_.path("go");
    ASSERT_EQ(::mkfifo(go.c_str(), 0600), 0);
    // The first waits for the word to go; by then all have been asked for.
    useScript("echo run >>" + runs + "; [ -e " + go + " ] && read word <" + go + " && rm " + go + "; echo '[]'");
    LinuxStoreLookup store(scheduler_, options_);
    const auto calls = std::make_shared<std::atomic<int>>(0);
    for (int i = 0; i < 40; ++i) store.start(requestFor({"a"}), [calls](const Products&) { ++*calls; });
    std::ofstream(go) << "go\n";
    EXPECT_TRUE(eventually([&] { return *calls == 40; }));
    const std::string all = ScratchDirectory::read(runs);
    EXPECT_EQ(std::count(all.begin(), all.end(), '\n'), 32);
}

TEST_F(LinuxStoreLookupTest, TheProgramGetsNothingButItsOwnEnvironment) {
    ASSERT_EQ(::setenv("LC_TEST_SECRET", "1", 1), 0);
    useScript(
        "[ -z \"$LC_TEST_SECRET\" ] && [ \"$LC_ALL\" = C.UTF-8 ] && [ -z \"$DBUS_SESSION_BUS_ADDRESS$DISPLAY\" ] && "
        "echo '[{\"name\":\"Clock\"}]'");
    EXPECT_EQ(find(requestFor({"a"})).size(), 1u);
    ::unsetenv("LC_TEST_SECRET");
}

TEST(LinuxStoreLookup, TheUsersEnvironmentSaysWhereAndInWhichLanguage) {
    const auto variables = [](std::string_view name) -> std::optional<std::string> {
        if (name == "HOME") return "/home/u";
        if (name == "LANG") return "de_AT.UTF-8";
        if (name == "XDG_DATA_DIRS") return "/a:/b";
        return std::nullopt;
    };
    const auto options =
        LinuxStoreLookup::optionsFrom(LinuxEnvironment::from(variables, 7, "/opt/x/bin/lumacastd", "/nonexistent"));
    EXPECT_EQ(options.program, "/opt/x/bin/../libexec/lumacast/lumacast-catalog");
    EXPECT_EQ(options.locale, "de_AT");
    const auto has = [&](const std::string& variable) {
        return std::find(options.environment.begin(), options.environment.end(), variable) != options.environment.end();
    };
    EXPECT_TRUE(has("XDG_DATA_DIRS=/a:/b"));
    EXPECT_TRUE(has("XDG_DATA_HOME=/home/u/.local/share"));
    EXPECT_TRUE(has("XDG_CACHE_HOME=/home/u/.cache/lumacast"));
    EXPECT_TRUE(has("LC_ALL=de_AT.UTF-8"));
    EXPECT_TRUE(options.catalogs.empty());
}

}  // namespace
}  // namespace lumacast
