#include "base/Concat.h"
#include "kstctl/Environment.h"
#include "kstctl/FileError.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/status/Section.h"
#include "kstd/DeviceRestrictedMode/StateFilePaths.h"
#include "platform/Files.h"
#include "platform/linux/RegularFile.h"
#include "wire/RestrictedMode.h"

namespace kstctl {

namespace {

/// Why the daemon takes the file for one that is not there; empty when it does not.
std::string problemOf(const std::string& path, const platform::RegularFile& file,
                      std::size_t leastSize) {
    if (file.failure == platform::ReadFailure::notRegular) {
        return base::concat(path, ": not a regular file");
    }
    return file.bytes.size() < leastSize
               ? base::concat(path, ": shorter than ", leastSize, " bytes")
               : std::string();
}

Section fileSection(const Environment& environment, const char* path, std::size_t leastSize,
                    void (*addFields)(Report& report, decode::Bytes bytes)) {
    const std::string real = environment.paths.under(path);
    const platform::RegularFile file = platform::readRegularFile(
        real, platform::kMaxLoadSize, {.takesBeginning = true, .followsLink = false});
    Section section;
    section.report.add("path", real);
    if (file.failure == platform::ReadFailure::missing) {
        section.report.add("isPresent", false);
        return section;
    }
    if (file.failure == platform::ReadFailure::unreadable) {
        section.addUnknown("isPresent", fileError(real, file.error));
        return section;
    }
    section.report.add("isPresent", true);
    if (const std::string problem = problemOf(real, file, leastSize); !problem.empty()) {
        section.addProblem(problem);
        return section;
    }
    section.report.add("size", file.bytes.size());
    addFields(section.report, file.bytes);
    return section;
}

} // namespace

Section stateFileSection(const Environment& environment) {
    return fileSection(environment, kstd::kStateFilePath, wire::rm::kStateBlobSize,
                       decode::addStateFields);
}

Section analyticsFileSection(const Environment& environment) {
    return fileSection(environment, kstd::kAnalyticsFilePath, wire::rm::kAnalyticsBlobSize,
                       decode::addAnalyticsFields);
}

} // namespace kstctl
