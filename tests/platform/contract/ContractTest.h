#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <ostream>
#include <string>

/// Contract suites: what every implementation of an interface must do, run against each of them.
///
/// A suite is written against an abstract fixture, which makes the implementation and shows a test
/// what the interface itself does not. An implementation takes part with a fixture of its own and
///
///     INSTANTIATE_TEST_SUITE_P(Linux, FilesContract,
///                              (fixtureOf<FilesFixture, LinuxFilesFixture>()));
namespace contract {

template <typename Fixture>
struct FixtureFactory {
    std::unique_ptr<Fixture> (*make)();

    friend void PrintTo(const FixtureFactory& /*factory*/, std::ostream* out) { *out << "fixture"; }
};

template <typename Fixture>
class ContractTest : public testing::TestWithParam<FixtureFactory<Fixture>> {
  protected:
    ContractTest() : fixture_(this->GetParam().make()) {}

    [[nodiscard]] Fixture& fixture() { return *fixture_; }

  private:
    std::unique_ptr<Fixture> fixture_;
};

/// The parameter of a suite that is run with one kind of fixture.
template <typename Fixture, typename Concrete>
[[nodiscard]] auto fixtureOf() {
    return testing::Values(FixtureFactory<Fixture>{[]() -> std::unique_ptr<Fixture> {
        return std::make_unique<Concrete>();
    }});
}

} // namespace contract
