#pragma once

// Capture cameras: rows of the cameras table.

#include "resources/CountStatement.h"
#include "resources/Resource.h"

#include <cstdint>
#include <vector>

namespace lumio {

class Camera final : public ResourceClass<Camera> {
  public:
    /// Every enabled camera, without its access list (dictionary() expands it); nullopt, with the error, on failure.
    [[nodiscard]] static std::optional<std::vector<std::unique_ptr<Camera>>> allCamerasWithError(
        std::optional<adminhost::Error>& error);

    // Numbers of enabled cameras: all, those not "offline", and those "capturing..." or "paused". A failure is logged
    // and counts 0. A camera without recording status is not counted as online.
    [[nodiscard]] static std::uint64_t getTotalCameraCount();
    [[nodiscard]] static std::uint64_t getOnlineCameraCount();
    [[nodiscard]] static std::uint64_t getRunningCameraCount();
    /// The three, in this order, for a caller that runs them together with others.
    [[nodiscard]] static std::vector<CountStatement> counts();

    [[nodiscard]] std::string_view resourceType() const noexcept override { return "camera"; }
    /// Removes the camera with the service's configuration tool, which owns its rows. An error of the domain
    /// "adminhost_lumio" has the tool's exit status; a camera without UUID is -1, and no tool runs.
    [[nodiscard]] std::optional<adminhost::Error> delete_() override;

  protected:
    [[nodiscard]] std::string_view className() const noexcept override { return "Camera"; }
};

}  // namespace lumio
