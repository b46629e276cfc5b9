#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"

namespace kstd {
namespace {

class PropertiesTest : public DatabaseFixture {
  protected:
    std::unique_ptr<KSTDSQLite> opened = openDatabase();
};

TEST_F(PropertiesTest, ValueStaysUntilItIsReplacedOrRemoved) {
    EXPECT_EQ(opened->propertyForKey("k"), std::nullopt);
    for (const std::string value : {"v", "", "it's \"quoted\" ? %@ \xc3\xb6"}) {
        opened->setProperty(value, "k");
        EXPECT_EQ(opened->propertyForKey("k"), value);
        EXPECT_EQ(OtherConnection(path).property("k"), value);
    }
    opened->setProperty("other", "k's");
    opened->setProperty(std::nullopt, "k");
    EXPECT_EQ(opened->propertyForKey("k"), std::nullopt);
    opened->removePropertyForKey("k's");
    opened->removePropertyForKey("k's");
    EXPECT_EQ(OtherConnection(path).one("select count(*) from Properties"), "3");
    EXPECT_EQ(lines(), Texts());
}

TEST_F(PropertiesTest, ValueThatIsNullInTheFileIsNone) {
    ASSERT_EQ(OtherConnection(path).run("insert into Properties values ('k', null)"), SQLITE_OK);
    EXPECT_EQ(opened->propertyForKey("k"), std::nullopt);
}

TEST_F(PropertiesTest, EveryUseEndsWithAReset) {
    opened->setProperty("v", "k");
    static_cast<void>(opened->propertyForKey("k"));
    static_cast<void>(opened->dbUserVersion());
    opened->removePropertyForKey("k");
    for (const auto& [text, statement] : opened->statementsBySQL()) {
        EXPECT_TRUE(statement->isReset()) << text;
        EXPECT_TRUE(statement->temporaryBoundObjects().empty()) << text;
    }
    opened->close();
    EXPECT_FALSE(opened->isOpen());
}

TEST_F(PropertiesTest, DatesAreTexts) {
    opened->setDateProperty(platform::Timestamp{721'692'800.75}, "k");
    EXPECT_EQ(opened->propertyForKey("k"), "2023-11-14T22:13:20Z");
    EXPECT_EQ(opened->datePropertyForKey("k"), platform::Timestamp{721'692'800});
    opened->setProperty("2023-11-15T00:13:20+02:00", "k");
    EXPECT_EQ(opened->datePropertyForKey("k"), platform::Timestamp{721'692'800});
    opened->setDateProperty(std::nullopt, "k");
    EXPECT_EQ(opened->propertyForKey("k"), std::nullopt);
    EXPECT_EQ(opened->datePropertyForKey("k"), std::nullopt);
    for (const char* const none : {"", "tomorrow", "2023-11-14"}) {
        opened->setProperty(none, "k");
        EXPECT_EQ(opened->datePropertyForKey("k"), std::nullopt) << none;
    }
}

class YearFormatter final : public DateFormatter {
  public:
    [[nodiscard]] std::string text(platform::Timestamp /*date*/) const override { return "year"; }
    [[nodiscard]] std::optional<platform::Timestamp>
    date(std::string_view /*text*/) const override {
        return platform::Timestamp{1};
    }
};

TEST_F(PropertiesTest, FormatterIsMadeOnceUnlessOneIsSet) {
    const std::shared_ptr<DateFormatter> made = opened->dateFormatter();
    ASSERT_NE(made, nullptr);
    EXPECT_EQ(opened->dateFormatter(), made);
    opened->setDateFormatter(std::make_shared<YearFormatter>());
    opened->setDateProperty(platform::Timestamp{5}, "k");
    EXPECT_EQ(opened->propertyForKey("k"), "year");
    EXPECT_EQ(opened->datePropertyForKey("k"), platform::Timestamp{1});
}

TEST_F(PropertiesTest, CreationDateIsA32BitFloat) {
    EXPECT_EQ(opened->creationDate(), platform::Timestamp{721'692'800});
    opened->setProperty("721692833.000000", "Created");
    EXPECT_EQ(opened->creationDate(), platform::Timestamp{721'692'864});
    opened->setProperty(" -1.5e1 o'clock", "Created");
    EXPECT_EQ(opened->creationDate(), platform::Timestamp{-15});
    for (const char* const none : {"", "soon", "inf", "nan", "1e99"}) {
        opened->setProperty(none, "Created");
        EXPECT_EQ(opened->creationDate(), platform::Timestamp{0}) << none;
    }
    opened->removePropertyForKey("Created");
    EXPECT_EQ(opened->creationDate(), platform::Timestamp{0});
}

TEST_F(PropertiesTest, MissingTableIsLogged) {
    ASSERT_TRUE(opened->executeSQL("drop table Properties"));
    opened->removeAllStatements();
    EXPECT_EQ(opened->propertyForKey("k"), std::nullopt);
    opened->setProperty("v", "k");
    opened->setProperty(std::nullopt, "k");
    EXPECT_EQ(
        lines(),
        (Texts{"Error preparing statement: select value from Properties where key = ?",
               "Error preparing statement: insert or replace into Properties (key, value) values "
               "(?,?)",
               "Error preparing statement: delete from Properties where key = ?"}));
}

} // namespace
} // namespace kstd
