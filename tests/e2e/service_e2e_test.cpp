// Two real processes across a real socket: the Java service host serving the
// fake vendor module, and native client processes that load the proxy
// library. The cases kill one side in the middle of a call.

#include <dirent.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/sockios.h>
#include <poll.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

// A child process with its standard input and output on pipes; standard
// error goes where the test's goes.
class Process {
public:
    // runAs: the user id the child runs under; -1 keeps the test's.
    explicit Process(const std::vector<std::string>& argv, uid_t runAs = static_cast<uid_t>(-1)) {
        int in[2], out[2];
        if (pipe2(in, O_CLOEXEC) != 0 || pipe2(out, O_CLOEXEC) != 0) return;
        pid_ = fork();
        if (pid_ == 0) {
            if (runAs != static_cast<uid_t>(-1) && (setgid(runAs) != 0 || setuid(runAs) != 0))
                _exit(126);
            dup2(in[0], STDIN_FILENO);
            dup2(out[1], STDOUT_FILENO);
            std::vector<char*> args;
            for (const std::string& a : argv) args.push_back(const_cast<char*>(a.c_str()));
            args.push_back(nullptr);
            execv(args[0], args.data());
            _exit(127);
        }
        close(in[0]);
        close(out[1]);
        input_ = in[1];
        output_ = out[0];
    }
    ~Process() {
        if (running()) kill(pid_, SIGKILL);
        wait();
        closeInput();
        if (output_ >= 0) close(output_);
    }
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;

    pid_t pid() const { return pid_; }
    bool running() {
        if (pid_ > 0 && !exited_ && waitpid(pid_, &status_, WNOHANG) == pid_) exited_ = true;
        return pid_ > 0 && !exited_;
    }

    // Reads lines until one starts with `prefix`; returns it, or "" when none
    // came before the end of output or `limit`.
    std::string waitForLine(const std::string& prefix, std::chrono::milliseconds limit = 30s) {
        const auto deadline = Clock::now() + limit;
        for (;;) {
            size_t end = buffer_.find('\n');
            if (end != std::string::npos) {
                lines_.push_back(buffer_.substr(0, end));
                buffer_.erase(0, end + 1);
                if (lines_.back().compare(0, prefix.size(), prefix) == 0) return lines_.back();
                continue;
            }
            auto left =
                std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
            if (left.count() <= 0) return "";
            pollfd p{output_, POLLIN, 0};
            if (poll(&p, 1, static_cast<int>(left.count())) <= 0) continue;
            char chunk[512];
            ssize_t n = read(output_, chunk, sizeof chunk);
            if (n <= 0) return "";
            buffer_.append(chunk, static_cast<size_t>(n));
        }
    }

    // Every line read so far, for failure messages.
    std::string transcript() const {
        std::string all;
        for (const std::string& l : lines_) all += "  " + l + "\n";
        return all;
    }

    bool writeLine(const std::string& line) {
        std::string text = line + "\n";
        return input_ >= 0 &&
               write(input_, text.data(), text.size()) == static_cast<ssize_t>(text.size());
    }
    void closeInput() {
        if (input_ >= 0) close(input_);
        input_ = -1;
    }
    void signal(int sig) { kill(pid_, sig); }

    // The exit status (as waitpid gives it); ctest's time limit ends a wait that never ends.
    int wait() {
        if (pid_ > 0 && !exited_ && waitpid(pid_, &status_, 0) == pid_) exited_ = true;
        return exited_ ? status_ : -1;
    }

    // Stops the process and waits until every one of its threads has stopped:
    // the stop reaches each thread on its own.
    ::testing::AssertionResult stop(std::chrono::milliseconds limit = 10s) {
        kill(pid_, SIGSTOP);
        const auto deadline = Clock::now() + limit;
        const std::string tasks = "/proc/" + std::to_string(pid_) + "/task";
        while (Clock::now() < deadline) {
            bool allStopped = true;
            if (DIR* dir = opendir(tasks.c_str())) {
                while (dirent* entry = readdir(dir)) {
                    if (entry->d_name[0] == '.') continue;
                    std::ifstream stat(tasks + "/" + entry->d_name + "/stat");
                    std::string line;
                    std::getline(stat, line);
                    size_t end = line.rfind(')');
                    if (end != std::string::npos && end + 2 < line.size() && line[end + 2] != 'T')
                        allStopped = false;
                }
                closedir(dir);
            }
            if (allStopped) return ::testing::AssertionSuccess();
            std::this_thread::sleep_for(5ms);
        }
        return ::testing::AssertionFailure() << "process " << pid_ << " did not stop";
    }

    // Waits until the process sleeps in one of the given system calls.
    ::testing::AssertionResult waitBlockedIn(const std::vector<long>& calls,
                                             std::chrono::milliseconds limit = 10s) {
        const auto deadline = Clock::now() + limit;
        std::string last;
        while (Clock::now() < deadline) {
            std::ifstream in("/proc/" + std::to_string(pid_) + "/syscall");
            std::getline(in, last);
            long number = std::atol(last.c_str());
            for (long c : calls)
                if (c == number && !last.empty()) return ::testing::AssertionSuccess();
            std::this_thread::sleep_for(5ms);
        }
        return ::testing::AssertionFailure() << "still in system call: " << last << "\n"
                                             << transcript();
    }

private:
    pid_t pid_ = -1;
    int input_ = -1;
    int output_ = -1;
    bool exited_ = false;
    int status_ = 0;
    std::string buffer_;
    std::vector<std::string> lines_;
};

bool exitedWith(int status, int code) {
    return status >= 0 && WIFEXITED(status) && WEXITSTATUS(status) == code;
}

const std::vector<long>& receiveCalls() {
    static const std::vector<long> calls = {
#ifdef SYS_recvfrom
        SYS_recvfrom,
#endif
#ifdef SYS_recv
        SYS_recv,
#endif
    };
    return calls;
}

const std::string kAllOnes = "rv=0xffffffffffffffff";

class ServiceE2eTest : public ::testing::Test {
protected:
    void SetUp() override {
        const auto* info = ::testing::UnitTest::GetInstance()->current_test_info();
        // The first character never reaches the socket's name.
        serverId_ = std::string("Xvok-e2e-") + std::to_string(getpid()) + "-" + info->name();
        startHost({});
    }

    void startHost(const std::vector<std::string>& options) {
        // Through env, which sets the sanitizer build's preloads for the host alone.
        std::vector<std::string> argv = {"/usr/bin/env"};
        std::istringstream environment(VOK_E2E_JAVA_ENVIRONMENT);
        for (std::string setting; environment >> setting;) argv.push_back(setting);
        argv.insert(argv.end(),
                    {VOK_E2E_JAVA, "-Djava.library.path=" + directoryOf(VOK_E2E_WRAPPER), "-cp",
                     VOK_E2E_JAR, "com.vok.smartcard.pkcs11.ServiceHost"});
        argv.insert(argv.end(), options.begin(), options.end());
        argv.insert(argv.end(), {serverId_, VOK_E2E_FAKE_VENDOR});
        host_.reset(new Process(argv));
        ASSERT_EQ(host_->waitForLine("serving"), "serving " + serverId_) << host_->transcript();
    }

    static std::string directoryOf(const std::string& path) {
        return path.substr(0, path.rfind('/'));
    }

    std::unique_ptr<Process> client(const std::vector<std::string>& args,
                                    uid_t runAs = static_cast<uid_t>(-1)) {
        std::vector<std::string> argv = {VOK_E2E_CLIENT, VOK_E2E_WRAPPER, serverId_};
        argv.insert(argv.end(), args.begin(), args.end());
        return std::unique_ptr<Process>(new Process(argv, runAs));
    }

    // Runs a round of calls in a new client process.
    void expectEveryStepPasses(const std::vector<std::string>& extra = {}) {
        std::vector<std::string> args = {"steps"};
        args.insert(args.end(), extra.begin(), extra.end());
        auto steps = client(args);
        EXPECT_EQ(steps->waitForLine("round "), "round ok") << steps->transcript();
        EXPECT_TRUE(exitedWith(steps->wait(), 0)) << steps->transcript();
    }

    // The service's usage time, asked of the host.
    long long usage() {
        EXPECT_TRUE(host_->writeLine("usage"));
        std::string line = host_->waitForLine("usage ");
        return line.empty() ? 0 : std::atoll(line.c_str() + 6);
    }

    std::string serverId_;
    std::unique_ptr<Process> host_;
};

TEST_F(ServiceE2eTest, KeepsServingAfterAClientIsKilledWhileItsCallIsServed) {
    auto victim = client({"call", "C_Initialize"});
    ASSERT_EQ(victim->waitForLine("connected"), "connected") << victim->transcript();

    // The service is held still so that the request is sent and the victim
    // waits for the answer when it dies; the answer then meets a closed socket.
    ASSERT_TRUE(host_->stop());
    victim->writeLine("go");
    ASSERT_FALSE(victim->waitForLine("calling").empty());
    ASSERT_TRUE(victim->waitBlockedIn(receiveCalls()));
    victim->signal(SIGKILL);
    victim->wait();
    host_->signal(SIGCONT);

    // The victim's C_Initialize reached the module before the service noticed.
    expectEveryStepPasses({"--already-initialized"});
    EXPECT_TRUE(host_->running());
}

// A client that dies halfway through its request: its socket closes with the
// header and half the payload read. The host stops when its input ends.
TEST_F(ServiceE2eTest, KeepsServingAfterAClientIsKilledHalfwayThroughItsRequest) {
    EXPECT_EQ(usage(), 0);  // no request yet
    sockaddr_un address{};
    address.sun_family = AF_UNIX;  // abstract: the id from its second character, zero-padded
    std::strncpy(address.sun_path + 1, serverId_.c_str() + 1, sizeof address.sun_path - 2);
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    ASSERT_EQ(connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    // A PKCS#11 command announcing 16 bytes of which only 8 ever come.
    const int32_t header[4] = {101, 103, 0, 16};
    const char half[8] = {0};
    ASSERT_EQ(send(fd, header, sizeof header, MSG_NOSIGNAL), ssize_t(sizeof header));
    ASSERT_EQ(send(fd, half, sizeof half, MSG_NOSIGNAL), ssize_t(sizeof half));
    // Nothing left in the send queue: the service has read the header, noted
    // the request's time and waits inside the payload.
    int unread = -1;
    for (int i = 0; i < 3000 && unread != 0 && ioctl(fd, SIOCOUTQ, &unread) == 0; ++i)
        if (unread != 0) std::this_thread::sleep_for(10ms);
    ASSERT_EQ(unread, 0);
    // The request has been taken in and never answered: -1 in the Java long.
    // The service notes it just after the header, which may be a moment after
    // the kernel handed the bytes over.
    long long during = 0;
    for (int i = 0; i < 3000 && (during = usage()) != -1; ++i) std::this_thread::sleep_for(10ms);
    EXPECT_EQ(during, -1);

    close(fd);
    expectEveryStepPasses();
    EXPECT_GT(usage(), 0);  // the last answer's time
    host_->closeInput();
    EXPECT_EQ(host_->waitForLine("stopped"), "stopped " + serverId_) << host_->transcript();
    EXPECT_TRUE(exitedWith(host_->wait(), 0));
}

TEST_F(ServiceE2eTest, ClientGetsAllOnesAtOnceWhenTheServiceIsKilledDuringACall) {
    auto caller = client({"call", "C_Initialize", "C_GetInfo", "C_GetInfo"});
    ASSERT_EQ(caller->waitForLine("connected"), "connected") << caller->transcript();
    caller->writeLine("go");
    ASSERT_EQ(caller->waitForLine("C_Initialize").substr(0, 19), "C_Initialize rv=0x0")
        << caller->transcript();

    ASSERT_TRUE(host_->stop());
    caller->writeLine("go");
    ASSERT_FALSE(caller->waitForLine("calling").empty());
    ASSERT_TRUE(caller->waitBlockedIn(receiveCalls()));
    host_->signal(SIGKILL);
    host_->wait();

    // Well inside the channel's 30-second receive timeout.
    std::string during = caller->waitForLine("C_GetInfo", 25s);
    EXPECT_NE(during.find(kAllOnes), std::string::npos) << caller->transcript();
    size_t ms = during.find("ms=");
    ASSERT_NE(ms, std::string::npos) << caller->transcript();
    EXPECT_LT(std::atoi(during.c_str() + ms + 3), 5000) << during;

    // The channel stays broken: the next call fails the same way.
    caller->writeLine("go");
    std::string after = caller->waitForLine("C_GetInfo", 25s);
    EXPECT_NE(after.find(kAllOnes), std::string::npos) << caller->transcript();
    EXPECT_TRUE(exitedWith(caller->wait(), 0));
}

TEST_F(ServiceE2eTest, AServiceWithAnAllowListServesOnlyTheUsersOnIt) {
    if (getuid() != 0) GTEST_SKIP() << "needs root to run a client under another user id";
    host_.reset();
    serverId_ += "-allow";
    startHost({"--allow-uids", "0"});
    auto stranger = client({"call", "C_GetInfo"}, 65534);
    EXPECT_EQ(stranger->waitForLine("FAIL"), "FAIL vokpkcs11_client_init: status 3")
        << stranger->transcript();
    expectEveryStepPasses();
}

}  // namespace
