// Keystrand for Linux with hostile tools at its gate's socket, and hostile words about sessions.

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "tests/neighbours/Batches.h"
#include "tests/neighbours/UsbFiles.h"
#include "tests/support/TemporaryDirectory.h"
#include "wire/GateMessages.h"
#include "wire/SystemPaths.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <linux/sockios.h>
#include <optional>
#include <string>
#include <string_view>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace neighbours {

namespace {

constexpr std::chrono::seconds kPatience{30};
constexpr uid_t kNobody = 65534;

base::FileDescriptor connectTo(const std::string& path) {
    base::FileDescriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const auto address = base::UnixAddress::of(path).value();
    const timeval patience{kPatience.count(), 0};
    ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    if (::connect(socket.get(), address.get(), address.size()) != 0) {
        socket.reset();
    }
    return socket;
}

bool sendTo(const base::FileDescriptor& socket, std::string_view packet, int flags = 0) {
    return ::send(socket.get(), packet.data(), packet.size(), MSG_NOSIGNAL | flags) ==
           static_cast<ssize_t>(packet.size());
}

/// None when the service has hung up.
std::optional<std::string> receiveFrom(const base::FileDescriptor& socket) {
    static std::string buffer(wire::kGateAnswerSize + 1, '\0');
    const ssize_t length = ::recv(socket.get(), buffer.data(), buffer.size(), 0);
    require(length >= 0 || errno != EAGAIN, "the service is silent");
    return length > 0 ? std::optional(buffer.substr(0, static_cast<std::size_t>(length)))
                      : std::nullopt;
}

std::string textOf(const Bytes& bytes) {
    return {bytes.begin(), bytes.end()};
}

/// A packet that is a request, as the page of the socket has it, not as the service reads it.
struct Request {
    enum class Kind { none, devices, status, accept, open };

    explicit Request(const std::string& packet) {
        if (packet == "devices\n" || packet == "status\n") {
            kind = packet == "status\n" ? Kind::status : Kind::devices;
            return;
        }
        std::vector<std::string> words(1);
        for (const char each : packet) {
            if (each == ' ') {
                words.emplace_back();
            } else {
                words.back().push_back(each);
            }
        }
        if (!words.back().ends_with('\n')) {
            return;
        }
        words.back().pop_back();
        if (words.size() == 2 && words[0] == "open" && isNumber(words[1], "604800")) {
            kind = Kind::open;
            seconds = words[1];
        } else if (words.size() == 4 && words[0] == "accept" && !words[1].empty() &&
                   isNumber(words[2], "4294967295") && isNumber(words[3], "18446744073709551615")) {
            kind = Kind::accept;
        }
    }

    /// In the one form that a number has.
    static bool isNumber(const std::string& word, const std::string& most) {
        const bool isPlain = !word.empty() && std::all_of(word.begin(), word.end(), [](char each) {
            return each >= '0' && each <= '9';
        });
        return isPlain && (word == "0" || word.front() != '0') &&
               (word.size() < most.size() || (word.size() == most.size() && word <= most));
    }

    Kind kind = Kind::none;
    std::string seconds = {};
};

/// What the service has been told in words said in full, and so what must hold. The period before
/// restricted mode is none here.
struct Expected {
    bool locked = true;
    bool starting = true;
    bool sleeping = false;
    bool restricted = true;
    bool isOpened = false;
    bool isDiskIn = false;

    [[nodiscard]] bool isClosed() const {
        return !isOpened && (starting || sleeping || restricted);
    }

    void unlock() {
        starting = false;
        restricted = false;
    }

    void hear(const std::string& word) {
        if (word == "locked") {
            locked = true;
            restricted = true;
        } else if (word == "unlocked") {
            locked = false;
            if (!sleeping) {
                unlock();
            }
        } else if (word == "going to sleep") {
            sleeping = true;
            restricted = true;
        } else if (word == "awake" && std::exchange(sleeping, false) && !locked) {
            unlock();
        }
        letIn();
    }

    void letIn() { isDiskIn = isDiskIn || !isClosed(); }
};

/// The service, who speaks to it, and the ports that it guards.
class GateStage {
  public:
    GateStage() : usb_(root_.path()) {
        // Another user can get as far as the sockets.
        std::filesystem::permissions(root_.path(), std::filesystem::perms(0755));
        std::filesystem::create_directories(root_.path() / "etc/keystrand");
        std::ofstream(root_.path() / "etc/keystrand/keystrand.conf") << "period = 0\n";
        service_.emplace(std::vector<std::string>{KEYSTRAND, "--root", root_.path().string()}, -1,
                         "keystrand: ready");
        const auto deadline = std::chrono::steady_clock::now() + kPatience;
        while (!service_->isReady()) {
            service_->listen();
            require(service_->runs(), "the service ended with " + service_->ending());
            require(std::chrono::steady_clock::now() < deadline, "the service is not ready");
            ::usleep(1000);
        }
        descriptorsAtRest_ = Footprint::of(service_->process()).descriptors;
    }

    void plugDisk() {
        // Whether it is in from the start is up to the ports as they are.
        settle();
        usb_.plugDisk();
        expected_.isDiskIn = !expected_.isClosed();
        isSettled_ = false;
        settle();
    }

    /// One packet at the gate's socket, or what else somebody does there.
    void ask(Random& random) {
        if (random.oneIn(200)) {
            crowd(random);
            return;
        }
        base::FileDescriptor& tool = tools_[random.below(tools_.size())];
        if (!tool.isOpen()) {
            tool = connectTo(gate_);
            require(tool.isOpen(), "cannot connect to the gate's socket");
        }
        const std::string packet = request(random);
        require(sendTo(tool, packet), "a packet is not taken");
        if (Request(packet).kind == Request::Kind::none && random.oneIn(60)) {
            // Gone before the answer is there.
            tool.reset();
            return;
        }
        const auto answer = receiveFrom(tool);
        if (packet.empty()) {
            require(!answer, "an answer to nothing");
            tool.reset();
            return;
        }
        require(answer.has_value(), "hung up on a tool");
        check(packet, *answer);
    }

    /// A packet at the sessions' socket, or what else somebody does there.
    void speak(Random& random) {
        if (::geteuid() == 0 && random.oneIn(50)) {
            speakAsAnother(random);
            return;
        }
        if (!sessions_.isOpen() || random.oneIn(100)) {
            speakAnew();
        }
        say(word(random));
        if (random.oneIn(100)) {
            settle();
            sessions_.reset();
        }
    }

    /// What holds is what was said in full: in the answers and at the ports.
    void settle() {
        service_->listen();
        require(service_->runs(), "the service ended with " + service_->ending());
        const auto deadline =
            std::chrono::steady_clock::now() + (isSettled_ ? std::chrono::seconds(0) : kPatience);
        for (std::string wrong = whatIsWrong(); !wrong.empty(); wrong = whatIsWrong()) {
            require(std::chrono::steady_clock::now() < deadline, wrong);
            ::usleep(100);
        }
        isSettled_ = true;
    }

    /// What everybody may rely on.
    void behave() {
        for (base::FileDescriptor& tool : tools_) {
            tool.reset();
        }
        speakAnew();
        for (const char* const said : {"awake", "locked"}) {
            say(said);
        }
        settle();
        plugDisk();
        require(expected_.isClosed() && !expected_.isDiskIn, "the gate of this test is open");
        require(asked(usb_.acceptDisk()) == "ok\n", "a device is not accepted");
        expected_.isDiskIn = true;
        isSettled_ = false;
        settle();
        plugDisk();
        for (const char* const said : {"unlocked", "locked", "going to sleep", "awake"}) {
            say(said);
            settle();
        }
        tools_[0].reset();
    }

    /// Once it has seen that the tools are gone. Who speaks of sessions stays.
    [[nodiscard]] Footprint footprint() const {
        const auto deadline = std::chrono::steady_clock::now() + kPatience;
        Footprint found = Footprint::of(service_->process());
        while (found.descriptors != descriptorsAtRest_ + 1 &&
               std::chrono::steady_clock::now() < deadline) {
            ::usleep(1000);
            found = Footprint::of(service_->process());
        }
        require(found.descriptors == descriptorsAtRest_ + 1,
                base::concat(found.descriptors, " descriptors in the place of ",
                             descriptorsAtRest_ + 1));
        return found;
    }

    void end() {
        service_->ask();
        const auto deadline = std::chrono::steady_clock::now() + kPatience;
        while (service_->runs()) {
            service_->listen();
            require(std::chrono::steady_clock::now() < deadline, "the service does not end");
            ::usleep(1000);
        }
        require(service_->ending() == "status 0", "the service ended with " + service_->ending());
    }

    [[nodiscard]] std::uint64_t lines() const { return service_->lines(); }
    [[nodiscard]] std::string report() const {
        std::string text;
        for (const std::string& line : service_->newest()) {
            text += "\n    " + line;
        }
        return text;
    }

  private:
    [[nodiscard]] std::string sessions() const {
        return wire::underRoot(root_.path().string(), wire::kSessionsSocket);
    }

    [[nodiscard]] std::string asked(const std::string& request) {
        if (!tools_[0].isOpen()) {
            tools_[0] = connectTo(gate_);
        }
        require(sendTo(tools_[0], request), "a request that keeps the rules is not taken");
        return receiveFrom(tools_[0]).value_or("");
    }

    /// The newest connection counts, and what another one has said and was not heard yet does not.
    void speakAnew() {
        settle();
        sessions_ = connectTo(sessions());
        require(sessions_.isOpen(), "cannot connect to the sessions' socket");
    }

    void say(const std::string& word) {
        static const std::string kWords[] = {"locked", "unlocked", "going to sleep", "awake"};
        const bool isWord =
            std::find(std::begin(kWords), std::end(kWords), word) != std::end(kWords);
        require(sendTo(sessions_, word), "a word is not taken");
        if (!isWord) {
            require(!receiveFrom(sessions_), "no hang-up after what is no word");
            sessions_.reset();
            return;
        }
        isSettled_ = false;
        expected_.hear(word);
        if (word == "going to sleep") {
            require(receiveFrom(sessions_) == "closed", "no word that the gate is closed");
        }
    }

    static std::string word(Random& random) {
        static constexpr const char* kWords[] = {"locked", "unlocked", "going to sleep", "awake"};
        if (random.oneIn(2)) {
            return random.of(kWords);
        }
        static constexpr const char* kNearly[] = {
            "closed", "lock",      "locked ",         " locked",      "Unlocked", "unlocked\n",
            "awak",   "un locked", "going  to sleep", "goingtosleep", "starting", "away"};
        switch (random.below(4)) {
        case 0:
            return random.of(kNearly);
        case 1:
            return textOf(random.bytes(random.length(300)));
        case 2:
            return random.of(kWords) + std::string(1, '\0') + random.of(kWords);
        default: {
            const std::string_view whole = random.of(kWords);
            Bytes bytes(whole.begin(), whole.end());
            mutate(random, bytes);
            return textOf(bytes);
        }
        }
    }

    /// Anybody may connect there, and is neither heard nor kept. The gate's socket is the owner's.
    void speakAsAnother(Random& random) {
        require(::seteuid(kNobody) == 0, "cannot be another user");
        const base::FileDescriptor gate = connectTo(gate_);
        const base::FileDescriptor other = connectTo(sessions());
        require(::seteuid(0) == 0, "cannot be root again");
        require(!gate.isOpen(), "another user is let to the gate's socket");
        require(other.isOpen(), "another user cannot connect to the sessions' socket");
        static_cast<void>(sendTo(other, word(random)));
        std::array<char, 32> buffer{};
        // With what it said unread, the hang-up is a reset.
        require(::recv(other.get(), buffer.data(), buffer.size(), 0) <= 0 && errno != EAGAIN,
                "another user is heard");
    }

    /// More tools than are served at once, none of which takes its answers.
    void crowd(Random& random) {
        std::vector<base::FileDescriptor> many;
        for (std::size_t count = random.length(24); count > 0; --count) {
            many.push_back(connectTo(gate_));
            for (std::size_t packets = random.below(random.oneIn(8) ? 200 : 4); packets > 0;
                 --packets) {
                const std::string packet = request(random);
                const Request::Kind kind = Request(packet).kind;
                // Nothing that would be done some time later.
                const bool isLater = kind == Request::Kind::open || kind == Request::Kind::accept;
                static_cast<void>(
                    sendTo(many.back(), isLater ? "devices\n" : packet, MSG_DONTWAIT));
            }
        }
    }

    std::string request(Random& random) const {
        static constexpr const char* kNearly[] = {"status",
                                                  "status \n",
                                                  "devices\nstatus\n",
                                                  "STATUS\n",
                                                  "open\n",
                                                  "open \n",
                                                  "open +5\n",
                                                  "open 05\n",
                                                  "open  5\n",
                                                  "open 5",
                                                  "open -1\n",
                                                  "open 5 \n",
                                                  "open 604801\n",
                                                  "open 5\nopen 5\n",
                                                  "accept\n",
                                                  "accept 1-2\n",
                                                  "accept 1-2 1\n",
                                                  "accept 1-2 1 1 1\n",
                                                  "accept  1-2 1 1\n",
                                                  "ok\n",
                                                  ""};
        switch (random.below(10)) {
        case 0:
            return "status\n";
        case 1:
            return "devices\n";
        case 2:
            return base::concat("open ", std::to_string(random.number()), '\n');
        case 3:
            return base::concat("accept ", random.oneIn(2) ? "1-2" : random.text(random.length(60)),
                                ' ', std::to_string(random.number()), ' ',
                                std::to_string(random.number()), '\n');
        case 4:
            return random.of(kNearly);
        case 5:
            return textOf(random.bytes(random.length(300)));
        case 6:
            return random.text(random.length(wire::kGateRequestSize + 1));
        case 7:
            return textOf(random.bytes(random.oneIn(50) ? random.below(100'000) : 257));
        default: {
            static constexpr const char* kWhole[] = {"status\n", "devices\n", "open 60\n"};
            const std::string whole = random.oneIn(2) ? usb_.acceptDisk() : random.of(kWhole);
            Bytes bytes(whole.begin(), whole.end());
            mutate(random, bytes);
            return textOf(bytes);
        }
        }
    }

    void check(const std::string& packet, const std::string& answer) {
        const Request asked(packet);
        const auto decoded = wire::decodeGateAnswer(answer);
        require(decoded.has_value(), "a malformed answer");
        const bool isRefused = std::holds_alternative<wire::GateRefusal>(*decoded);
        switch (asked.kind) {
        case Request::Kind::none:
            require(answer == "error not understood\n", "an answer to what is no request");
            break;
        case Request::Kind::devices:
            require(std::holds_alternative<wire::GateDevices>(*decoded), "no list of devices");
            break;
        case Request::Kind::status:
            require(std::holds_alternative<wire::GateStatus>(*decoded), "no status");
            break;
        case Request::Kind::accept:
            require(isRefused || packet == usb_.acceptDisk() || packet == usb_.acceptMouse(),
                    "a device that was never listed is accepted");
            expected_.isDiskIn = expected_.isDiskIn || packet == usb_.acceptDisk();
            isSettled_ = isSettled_ && isRefused;
            break;
        case Request::Kind::open:
            require(answer == "ok\n", "not opened");
            expected_.isOpened = asked.seconds != "0";
            expected_.letIn();
            // Its end comes by itself, and is not waited for.
            if (std::exchange(expected_.isOpened, false)) {
                require(this->asked("open 0\n") == "ok\n", "not closed again");
            }
            isSettled_ = false;
            break;
        }
    }

    /// Empty when nothing is. A word comes by another socket than the question for the status, and
    /// until it is read what holds may be what held before.
    [[nodiscard]] std::string whatIsWrong() {
        int unread = 0;
        if (sessions_.isOpen() &&
            (::ioctl(sessions_.get(), SIOCOUTQ, &unread) != 0 || unread > 0)) {
            return "a word is not read";
        }
        const auto answer = wire::decodeGateAnswer(asked("status\n"));
        require(answer && std::holds_alternative<wire::GateStatus>(*answer), "no status");
        const auto& status = std::get<wire::GateStatus>(*answer);
        const std::pair<const char*, bool> wrong[] = {
            {"locked", status.locked != expected_.locked},
            {"starting", status.starting != expected_.starting},
            {"sleeping", status.sleeping != expected_.sleeping},
            {"restricted", status.restricted != expected_.restricted},
            {"opened", status.untilClosed.has_value() != expected_.isOpened},
            {"closed", status.closed != expected_.isClosed()},
            {"the ports", usb_.arePortsClosed() != expected_.isClosed()},
            {"the mouse", !usb_.isMouseIn()},
            {"the disk", usb_.isDiskIn() != expected_.isDiskIn}};
        std::string text;
        for (const auto& [what, isWrong] : wrong) {
            text += isWrong ? base::concat(text.empty() ? "not as it was said: " : ", ", what) : "";
        }
        return text;
    }

    support::TemporaryDirectory root_;
    UsbFiles usb_;
    const std::string gate_ = wire::underRoot(root_.path().string(), wire::kGateSocket);
    std::optional<Daemon> service_;
    /// With nobody connected.
    std::size_t descriptorsAtRest_ = 0;
    std::array<base::FileDescriptor, 3> tools_;
    base::FileDescriptor sessions_;
    Expected expected_;
    /// Nothing was said since it was looked at that may be heard later.
    bool isSettled_ = false;
};

} // namespace

void runGate(const RunOptions& options) {
    constexpr std::uint64_t kBatch = 1'000;
    Batches batches(options, "gate");
    Growth growth(mostGrowth(4'000));
    GateStage stage;
    stage.behave();
    std::uint64_t exchanges = 0;
    batches.setReport([&] { return stage.report(); });
    batches.guard([&] {
        do {
            Random random = batches.ideas();
            stage.plugDisk();
            for (std::uint64_t i = 0; i < kBatch; ++i) {
                if (random.oneIn(4)) {
                    stage.speak(random);
                } else {
                    stage.ask(random);
                }
                if (random.oneIn(20)) {
                    stage.settle();
                }
            }
            stage.behave();
            growth.look(stage.footprint());
            exchanges += kBatch;
            require(stage.lines() <= 40 * exchanges, "more lines than anybody reads");
        } while (batches.end(exchanges));
    });
    stage.end();
    batches.print(base::concat(stage.lines(), " lines, ", growth.text()));
    if (::geteuid() != 0) {
        std::puts("gate: not root, so no other user has tried");
    }
}

} // namespace neighbours
