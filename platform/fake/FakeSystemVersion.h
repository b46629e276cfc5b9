#pragma once

#include "platform/SystemVersion.h"

#include <utility>

namespace platform {

/// A system whose version a test sets; nothing is known at first.
class FakeSystemVersion final : public SystemVersion {
  public:
    [[nodiscard]] std::optional<std::string> build() override { return build_; }
    [[nodiscard]] std::optional<std::string> product() override { return product_; }

    void setBuild(std::optional<std::string> build) { build_ = std::move(build); }
    void setProduct(std::optional<std::string> product) { product_ = std::move(product); }

  private:
    std::optional<std::string> build_;
    std::optional<std::string> product_;
};

} // namespace platform
