#include <gtest/gtest.h>

#include <functional>
#include <map>

#include "linux/system/LinuxPreferences.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/fakes/FakePreferences.h"

namespace lumacast {
namespace {

class PreferencesWorld {
public:
    virtual ~PreferencesWorld() = default;
    virtual const Preferences& preferences() = 0;
    virtual void set(const std::string& domain, const std::string& key, const Value& value) = 0;
    virtual void erase(const std::string& domain, const std::string& key) = 0;
};

class FakePreferencesWorld final : public PreferencesWorld {
public:
    const Preferences& preferences() override { return preferences_; }
    void set(const std::string& domain, const std::string& key, const Value& value) override {
        preferences_.set(domain, key, value);
    }
    void erase(const std::string& domain, const std::string& key) override { preferences_.erase(domain, key); }

private:
    FakePreferences preferences_;
};

class PortPreferencesWorld final : public PreferencesWorld {
public:
    const Preferences& preferences() override { return preferences_; }
    void set(const std::string& domain, const std::string& key, const Value& value) override {
        domains_[domain][key] = written(value);
        save(domain);
    }
    void erase(const std::string& domain, const std::string& key) override {
        domains_[domain].erase(key);
        save(domain);
    }

private:
    static std::string written(const Value& value) {
        if (const bool* truth = value.as<bool>()) return *truth ? "true" : "false";
        if (const std::string* text = value.as<std::string>()) return *text;
        return describe(value);
    }
    void save(const std::string& domain) {
        std::string text = "# written by a test\n";
        for (const auto& [key, value] : domains_[domain]) text += key + " = " + value + "\n";
        scratch_.write("lumacast/" + domain + ".conf", text);
    }

    ScratchDirectory scratch_;
    std::map<std::string, std::map<std::string, std::string>> domains_;
    LinuxPreferences preferences_{{scratch_.path()}, std::chrono::seconds(30)};
};

using Maker = std::function<std::unique_ptr<PreferencesWorld>()>;

class PreferencesContract : public ::testing::TestWithParam<Maker> {
protected:
    std::optional<Value> value(std::string_view key, std::string_view domain = kPreferenceDomain) {
        return world_->preferences().value(domain, key);
    }
    void set(const std::string& key, const Value& value) { world_->set(std::string(kPreferenceDomain), key, value); }

    std::unique_ptr<PreferencesWorld> world_ = GetParam()();
};

TEST_P(PreferencesContract, WhatNobodySetIsNone) {
    EXPECT_EQ(value("LCSuppressAlert"), std::nullopt);
    set("Other", true);
    EXPECT_EQ(value("LCSuppressAlert"), std::nullopt);
    EXPECT_EQ(value(""), std::nullopt);
    EXPECT_EQ(value("Other", ""), std::nullopt);
    EXPECT_EQ(value("Other", "../" + std::string(kPreferenceDomain)), std::nullopt);
}

TEST_P(PreferencesContract, EveryKindComesBackAsItWasSet) {
    for (const Value& each : {Value(true), Value(false), Value(std::int64_t{1'000'000}), Value(std::int64_t{-3}),
                              Value(0.25), Value("some text"), Value("")}) {
        set("Key", each);
        EXPECT_EQ(value("Key"), each) << describe(each);
    }
}

TEST_P(PreferencesContract, AChangeCountsFromTheNextQuestionOn) {
    set("Key", std::int64_t{1});
    EXPECT_EQ(value("Key"), Value(std::int64_t{1}));
    set("Key", std::int64_t{2});
    EXPECT_EQ(value("Key"), Value(std::int64_t{2}));
    world_->erase(std::string(kPreferenceDomain), "Key");
    EXPECT_EQ(value("Key"), std::nullopt);
}

TEST_P(PreferencesContract, DomainsAreApart) {
    world_->set("org.example.other", "Key", true);
    EXPECT_EQ(value("Key"), std::nullopt);
    EXPECT_EQ(value("Key", "org.example.other"), Value(true));
}

INSTANTIATE_TEST_SUITE_P(Fake, PreferencesContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakePreferencesWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, PreferencesContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortPreferencesWorld>(); })));

}  // namespace
}  // namespace lumacast
