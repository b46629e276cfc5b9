#include "tests/kstctl/KstctlFixture.h"

#include "base/Concat.h"
#include "platform/formats/JSONCodec.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>

namespace kstctl {

Ran KstctlFixture::kstctl(const Arguments& arguments, const RunOptions& options) {
    Arguments all{"--root", root.path().string()};
    all.insert(all.end(), arguments.begin(), arguments.end());
    Ran ran = runKstctl(all, options);
    EXPECT_EQ(std::count(ran.err.begin(), ran.err.end(), '\n'), ran.status == 0 ? 0 : 1) << ran.err;
    EXPECT_EQ(ran.err.rfind("kstctl: ", 0) == 0, ran.status != 0) << ran.err;
    EXPECT_EQ(ran.err.find('\x1b'), std::string::npos);
    EXPECT_TRUE(options.onTerminal || ran.out.find('\x1b') == std::string::npos);
    return ran;
}

platform::Value KstctlFixture::json(const Arguments& arguments, int status) {
    Arguments all = arguments;
    all.emplace_back("--json");
    const Ran ran = kstctl(all);
    EXPECT_EQ(ran.status, status) << ran.err;
    EXPECT_TRUE(ran.out.ends_with('\n'));
    const auto value = platform::readJSON(ran.out.substr(0, ran.out.size() - 1));
    EXPECT_TRUE(value) << ran.out;
    return value ? value.value() : platform::Value();
}

void KstctlFixture::expectFailure(const Arguments& arguments, int status, const std::string& line,
                                  const RunOptions& options) {
    const Ran ran = kstctl(arguments, options);
    EXPECT_EQ(ran.status, status) << line;
    EXPECT_EQ(ran.err, base::concat("kstctl: ", line, "\n"));
}

std::map<std::string, std::size_t> KstctlFixture::files() const {
    namespace fs = std::filesystem;
    std::map<std::string, std::size_t> all;
    for (const auto& entry : fs::recursive_directory_iterator(root.path())) {
        std::string content;
        if (entry.is_regular_file()) {
            std::ifstream file(entry.path(), std::ios::binary);
            content.assign(std::istreambuf_iterator<char>(file), {});
        }
        all[entry.path().string()] = std::hash<std::string>()(content);
    }
    return all;
}

platform::Value at(const platform::Value& value, const std::string& path) {
    if (path.empty()) {
        return value;
    }
    const std::size_t point = path.find('.');
    const std::string step = path.substr(0, point);
    const std::string rest = point == std::string::npos ? std::string() : path.substr(point + 1);
    if (const auto* const map = value.as<platform::ValueMap>();
        map != nullptr && map->contains(step)) {
        return at(map->at(step), rest);
    }
    if (const auto* const list = value.as<platform::ValueList>();
        list != nullptr && std::all_of(step.begin(), step.end(), ::isdigit) &&
        std::stoul(step) < list->size()) {
        return at((*list)[std::stoul(step)], rest);
    }
    return platform::Value("there is no " + path);
}

std::vector<std::string> pathsIn(const platform::Value& value, const std::string& prefix) {
    std::vector<std::string> paths;
    const auto add = [&paths](const std::string& path, const platform::Value& element) {
        paths.push_back(path);
        const auto deeper = pathsIn(element, path + '.');
        paths.insert(paths.end(), deeper.begin(), deeper.end());
    };
    if (const auto* const map = value.as<platform::ValueMap>()) {
        for (const auto& [key, element] : *map) {
            add(prefix + key, element);
        }
    } else if (const auto* const list = value.as<platform::ValueList>();
               list != nullptr && !list->empty()) {
        add(prefix + "0", list->front());
    }
    return paths;
}

} // namespace kstctl
