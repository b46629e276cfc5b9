// What the logger takes from the delivered configuration and from what the administrator has set.

#include "tests/kstd/Analytics/LoggerFixture.h"

namespace kstd {
namespace {

using platform::Link;
using platform::Value;

class ConfigurationTest : public LoggerFixture {
  protected:
    void setDefault(const std::string& key, const Value& value) {
        fake.defaults.set("com.zerva.keystrand.analytics", key, value);
    }

    void configureAll() {
        configure("splunk_topic", "delivered");
        configure("splunk_uploadURL", "https://delivered.example/up");
        configure("splunk_bagURL", "https://delivered.example/bag");
        configure("splunk_allowInsecureCertificate", false);
    }

    void expect(const std::optional<std::string>& topic, const std::optional<Link>& uploadLink,
                const std::optional<Link>& bagLink, bool allowsInsecure) {
        EXPECT_EQ(logger().splunkTopicName(), topic);
        EXPECT_EQ(logger().fields.splunkUploadURL, uploadLink);
        EXPECT_EQ(logger().splunkBagURL(), bagLink);
        EXPECT_EQ(logger().allowsInsecureSplunkCert(), allowsInsecure);
    }

    const Link deliveredUpload{"https://delivered.example/up"};
    const Link deliveredBag{"https://delivered.example/bag"};
};

TEST_F(ConfigurationTest, MissingResource) {
    static_cast<void>(TestLogger::logger(fake.host()));
    EXPECT_EQ(takeLines(), Lines());
    expect(std::nullopt, std::nullopt, std::nullopt, false);
}

TEST_F(ConfigurationTest, Delivered) {
    configureAll();
    expect("delivered", deliveredUpload, deliveredBag, false);
}

TEST_F(ConfigurationTest, SetByTheAdministrator) {
    configureAll();
    setDefault("splunk_topic", "set");
    setDefault("splunk_uploadURL", "http://set.example/up");
    setDefault("splunk_bagURL", "http://set.example/bag");
    setDefault("splunk_allowInsecureCertificate", true);
    expect("set", Link{"http://set.example/up"}, Link{"http://set.example/bag"}, true);
}

TEST_F(ConfigurationTest, SetWithoutAResource) {
    setDefault("splunk_topic", "");
    setDefault("splunk_uploadURL", "x:y");
    expect("", Link{"x:y"}, std::nullopt, false);
}

TEST_F(ConfigurationTest, SettingsOfAnotherDomainAreOthers) {
    configureAll();
    fake.defaults.set("com.zerva.keystrand", "splunk_topic", "set");
    expect("delivered", deliveredUpload, deliveredBag, false);
}

TEST_F(ConfigurationTest, InsecureInEitherPlaceIsInsecure) {
    configure("splunk_allowInsecureCertificate", true);
    setDefault("splunk_allowInsecureCertificate", false);
    EXPECT_TRUE(logger().allowsInsecureSplunkCert());
}

TEST_F(ConfigurationTest, SetValuesOfAnotherKindReplaceNothing) {
    configureAll();
    setDefault("splunk_topic", std::int64_t{1});
    setDefault("splunk_uploadURL", true);
    setDefault("splunk_bagURL", platform::ValueList{"https://set.example/bag"});
    setDefault("splunk_allowInsecureCertificate", std::int64_t{1});
    expect("delivered", deliveredUpload, deliveredBag, false);
}

TEST_F(ConfigurationTest, SetTextsThatAreNoLinksReplaceNothing) {
    configureAll();
    setDefault("splunk_uploadURL", "no link");
    setDefault("splunk_bagURL", "");
    expect("delivered", deliveredUpload, deliveredBag, false);
}

TEST_F(ConfigurationTest, DeliveredValuesOfAnotherKindAreNone) {
    configure("splunk_topic", platform::ValueMap());
    configure("splunk_uploadURL", std::int64_t{1});
    configure("splunk_bagURL", "/relative");
    configure("splunk_allowInsecureCertificate", "YES");
    expect(std::nullopt, std::nullopt, std::nullopt, false);
}

TEST_F(ConfigurationTest, ReadOnceWhenTheLoggerIsMade) {
    configure("splunk_topic", "first");
    logger();
    configure("splunk_topic", "second");
    setDefault("splunk_topic", "third");
    EXPECT_EQ(TestLogger::logger(fake.host())->splunkTopicName(), "first");
}

TEST_F(ConfigurationTest, IntervalOfADevelopersMachine) {
    fake.diagnostics.enable("Keystrand");
    EXPECT_EQ(logger().fields.secondsBetweenUploads, 60);
    logger().logEventNamed("event", nullptr);
    EXPECT_EQ(dueDate(), kNow + 60);
}

TEST_F(ConfigurationTest, IntervalOfAnyOther) {
    fake.diagnostics.enable("Other");
    EXPECT_EQ(logger().fields.secondsBetweenUploads, 259200);
}

} // namespace
} // namespace kstd
