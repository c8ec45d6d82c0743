#include "tests/support/media/pulse_server.h"

#include <QDir>
#include <QFile>
#include <QStringList>
#include <QTemporaryDir>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <limits>
#include <mutex>
#include <optional>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

extern char **environ;

namespace zaf::test {

namespace {

constexpr auto kPollInterval = std::chrono::milliseconds(10);

// A started child: spawned with posix_spawnp (see child_process.h for why not QProcess).
class Child {
public:
    ~Child() { stop(SIGTERM); }

    // Starts `program` with `args`; `environment` entries replace or add to this process's own;
    // standard output goes to `outFd` (or /dev/null), standard error to the file `errPath`.
    bool start(const QString &program, const QStringList &args, const QStringList &environment, int outFd,
        const QString &errPath, QString *error)
    {
        QStringList env;
        for (char **e = environ; *e; ++e) {
            const QString entry = QString::fromLocal8Bit(*e);
            const QString key = entry.section(QLatin1Char('='), 0, 0) + QLatin1Char('=');
            if (std::none_of(environment.begin(), environment.end(), [&](const QString &o) { return o.startsWith(key); }))
                env.append(entry);
        }
        env += environment;
        std::vector<QByteArray> storage;
        auto pointers = [&storage](const QStringList &list) {
            std::vector<char *> p;
            for (const QString &s : list) {
                storage.push_back(QFile::encodeName(s));
                p.push_back(storage.back().data());
            }
            p.push_back(nullptr);
            return p;
        };
        storage.reserve(size_t(args.size() + env.size() + 2));
        std::vector<char *> argv = pointers(QStringList{program} + args);
        std::vector<char *> envp = pointers(env);
        const QByteArray errFile = QFile::encodeName(errPath);
        posix_spawn_file_actions_t actions;
        posix_spawn_file_actions_init(&actions);
        posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
        if (outFd >= 0)
            posix_spawn_file_actions_adddup2(&actions, outFd, STDOUT_FILENO);
        else
            posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
        posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, errFile.constData(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
        pid_t pid = 0;
        const int rc = posix_spawnp(&pid, argv[0], &actions, nullptr, argv.data(), envp.data());
        posix_spawn_file_actions_destroy(&actions);
        if (rc != 0) {
            *error = QStringLiteral("%1 cannot start: %2").arg(program, QString::fromLocal8Bit(std::strerror(rc)));
            return false;
        }
        m_pid = pid;
        return true;
    }

    bool running()
    {
        if (m_pid <= 0)
            return false;
        int status = 0;
        if (::waitpid(m_pid, &status, WNOHANG) == m_pid)
            m_pid = 0;
        return m_pid > 0;
    }

    // Sends `signal` and reaps the child; SIGKILL follows when it has not ended within 5 s.
    void stop(int signal)
    {
        if (m_pid <= 0)
            return;
        ::kill(m_pid, signal);
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(5);
        while (running() && std::chrono::steady_clock::now() < deadline)
            std::this_thread::sleep_for(kPollInterval);
        if (m_pid > 0) {
            ::kill(m_pid, SIGKILL);
            ::waitpid(m_pid, nullptr, 0);
            m_pid = 0;
        }
    }

    pid_t pid() const { return m_pid; }

private:
    pid_t m_pid = 0;
};

bool socketAnswers(const QString &path)
{
    const QByteArray name = QFile::encodeName(path);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (size_t(name.size()) >= sizeof(address.sun_path))
        return false;
    std::memcpy(address.sun_path, name.constData(), size_t(name.size()));
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0)
        return false;
    const bool connected = ::connect(fd, reinterpret_cast<sockaddr *>(&address), sizeof(address)) == 0;
    ::close(fd);
    return connected;
}

QString tail(const QString &path)
{
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly))
        return {};
    return QString::fromLocal8Bit(file.readAll()).trimmed().right(600);
}

} // namespace

double hostSeconds()
{
    return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

struct PulseServer::Private {
    QTemporaryDir dir{QDir::tempPath() + QStringLiteral("/zaf-pulse-XXXXXX")};
    Child daemon;
    QString error;
    std::optional<QByteArray> previousServer;
    QString socketPath() const { return dir.path() + QStringLiteral("/native"); }
    // What the daemon and every client started here see: no user's home, runtime or config.
    QStringList environment() const
    {
        const QString root = dir.path();
        return {QStringLiteral("HOME=") + root, QStringLiteral("XDG_RUNTIME_DIR=") + root,
            QStringLiteral("XDG_CONFIG_HOME=") + root + QStringLiteral("/config"),
            QStringLiteral("PULSE_RUNTIME_PATH=") + root + QStringLiteral("/runtime"),
            QStringLiteral("PULSE_STATE_PATH=") + root + QStringLiteral("/state"),
            QStringLiteral("PULSE_CLIENTCONFIG=") + root + QStringLiteral("/client.conf"),
            QStringLiteral("PULSE_SERVER=unix:") + socketPath()};
    }
};

PulseServer::PulseServer()
    : d(std::make_unique<Private>())
{
    if (!d->dir.isValid()) {
        d->error = QStringLiteral("no scratch directory for the sound server");
        return;
    }
    {
        // Clients never start a server of their own when this one is gone.
        QFile config(d->dir.filePath(QStringLiteral("client.conf")));
        if (!config.open(QIODevice::WriteOnly) || config.write("autospawn = no\n") < 0) {
            d->error = QStringLiteral("cannot write the client configuration");
            return;
        }
    }
    const QStringList args{QStringLiteral("-n"), QStringLiteral("--daemonize=no"), QStringLiteral("--exit-idle-time=-1"),
        QStringLiteral("--use-pid-file=no"), QStringLiteral("--system=no"), QStringLiteral("--realtime=no"),
        QStringLiteral("--high-priority=no"), QStringLiteral("--disallow-module-loading=yes"),
        QStringLiteral("--log-target=stderr"), QStringLiteral("-L"),
        QStringLiteral("module-null-sink sink_name=%1 format=float32le rate=48000 channels=2 norewinds=1").arg(sinkName()),
        QStringLiteral("-L"), QStringLiteral("module-native-protocol-unix auth-anonymous=1 socket=%1").arg(d->socketPath())};
    const QString log = d->dir.filePath(QStringLiteral("daemon.log"));
    if (!d->daemon.start(QStringLiteral("pulseaudio"), args, d->environment(), -1, log, &d->error))
        return;
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (!socketAnswers(d->socketPath())) {
        if (!d->daemon.running()) {
            d->error = QStringLiteral("pulseaudio ended: %1").arg(tail(log));
            return;
        }
        if (std::chrono::steady_clock::now() > deadline) {
            d->error = QStringLiteral("pulseaudio did not answer within 10 s: %1").arg(tail(log));
            d->daemon.stop(SIGKILL);
            return;
        }
        std::this_thread::sleep_for(kPollInterval);
    }
    if (qEnvironmentVariableIsSet("PULSE_SERVER"))
        d->previousServer = qgetenv("PULSE_SERVER");
    for (const QString &entry : d->environment())
        qputenv(entry.section(QLatin1Char('='), 0, 0).toLatin1(), QFile::encodeName(entry.section(QLatin1Char('='), 1)));
}

PulseServer::~PulseServer()
{
    d->daemon.stop(SIGTERM);
    if (d->previousServer)
        qputenv("PULSE_SERVER", *d->previousServer);
    else
        qunsetenv("PULSE_SERVER");
}

bool PulseServer::ok() const { return d->error.isEmpty() && d->daemon.pid() > 0; }
QString PulseServer::error() const { return d->error.isEmpty() && d->daemon.pid() <= 0 ? QStringLiteral("pulseaudio is not running") : d->error; }
QString PulseServer::sinkName() { return QStringLiteral("zaf_null"); }
QString PulseServer::address() const { return QStringLiteral("unix:") + d->socketPath(); }
qint64 PulseServer::pid() const { return d->daemon.pid(); }
void PulseServer::kill() { d->daemon.stop(SIGKILL); }

struct SinkRecording::Private {
    Child recorder;
    QString error;
    QString errPath;
    int readFd = -1;
    std::thread reader; // joined by stop()
    std::mutex mutex;
    std::vector<float> samples;
    double firstSampleHost = std::numeric_limits<double>::infinity();
    std::atomic<bool> receiving{false};

    void read()
    {
        std::vector<char> block(4096);
        qsizetype partial = 0; // bytes of an incomplete sample carried over
        for (;;) {
            const ssize_t n = ::read(readFd, block.data() + partial, block.size() - size_t(partial));
            if (n < 0 && errno == EINTR)
                continue;
            if (n <= 0)
                return;
            const double arrival = hostSeconds();
            const qsizetype bytes = partial + n;
            const qsizetype whole = bytes / qsizetype(sizeof(float));
            {
                std::lock_guard lock(mutex);
                const size_t before = samples.size();
                samples.resize(before + size_t(whole));
                std::memcpy(samples.data() + before, block.data(), size_t(whole) * sizeof(float));
                firstSampleHost = std::min(firstSampleHost, arrival - double(samples.size()) / kRate);
            }
            partial = bytes - whole * qsizetype(sizeof(float));
            std::memmove(block.data(), block.data() + whole * qsizetype(sizeof(float)), size_t(partial));
            receiving = true;
        }
    }
};

SinkRecording::SinkRecording(const PulseServer &server)
    : d(std::make_unique<Private>())
{
    if (!server.ok()) {
        d->error = server.error();
        return;
    }
    int fds[2];
    if (::pipe2(fds, O_CLOEXEC) != 0) {
        d->error = QStringLiteral("no pipe for the recorder");
        return;
    }
    d->errPath = QDir::tempPath() + QStringLiteral("/zaf-parec-%1.log").arg(::getpid());
    const QStringList args{QStringLiteral("--server=") + server.address(), QStringLiteral("--device=") + PulseServer::sinkName() + QStringLiteral(".monitor"),
        QStringLiteral("--raw"), QStringLiteral("--format=float32le"), QStringLiteral("--rate=%1").arg(kRate),
        QStringLiteral("--channels=1"), QStringLiteral("--latency-msec=5")};
    const bool started = d->recorder.start(QStringLiteral("parec"), args, {QStringLiteral("PULSE_CLIENTCONFIG=/dev/null")}, fds[1], d->errPath, &d->error);
    ::close(fds[1]);
    d->readFd = fds[0];
    if (!started)
        return;
    d->reader = std::thread([this] { d->read(); });
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(5);
    while (!d->receiving) {
        if (!d->recorder.running() || std::chrono::steady_clock::now() > deadline) {
            d->error = QStringLiteral("parec recorded nothing: %1").arg(tail(d->errPath));
            stop();
            return;
        }
        std::this_thread::sleep_for(kPollInterval);
    }
}

SinkRecording::~SinkRecording()
{
    stop();
    QFile::remove(d->errPath);
}

bool SinkRecording::ok() const { return d->error.isEmpty() && d->readFd >= 0; }
QString SinkRecording::error() const { return d->error; }

void SinkRecording::stop()
{
    d->recorder.stop(SIGTERM);
    if (d->reader.joinable())
        d->reader.join();
    if (d->readFd >= 0)
        ::close(d->readFd);
    d->readFd = -1;
}

double SinkRecording::hostTimeOfFirstSample() const
{
    std::lock_guard lock(d->mutex);
    return d->firstSampleHost;
}

qsizetype SinkRecording::sampleCount() const
{
    std::lock_guard lock(d->mutex);
    return qsizetype(d->samples.size());
}

QList<double> SinkRecording::clickHostTimes(float threshold, double gapSeconds) const
{
    std::lock_guard lock(d->mutex);
    QList<double> clicks;
    const qsizetype gap = qsizetype(gapSeconds * kRate);
    qsizetype quietSince = 0;
    bool inClick = false;
    for (qsizetype i = 0; i < qsizetype(d->samples.size()); ++i) {
        const bool loud = std::abs(d->samples[size_t(i)]) > threshold;
        if (loud) {
            if (!inClick && i - quietSince >= gap)
                clicks.append(d->firstSampleHost + double(i) / kRate);
            inClick = true;
        } else if (inClick) {
            inClick = false;
            quietSince = i;
        }
    }
    return clicks;
}

} // namespace zaf::test
