#include <koru/event.h>
#include <koru/logfile.h>
#include <koru/thread.h>

#include <csignal>
#include <iostream>

#include <pthread.h>
#include <unistd.h>

// A signal handler may call nothing of the library. So no thread handles the signal: all block it,
// and one waits for it.
class Worker : public Koru::Thread {
public:
    Worker() : stopping_(false) {}

    void* run(void*) override {
        Koru::LogFile log(Koru::File::Path("worker.log"));
        log.open(Koru::File::WRITE);
        while (!stopping_.test()) Koru::Thread::sleep(1);
        log << "stopped\n" << std::flush;
        return nullptr;
    }

    void stop() override { stopping_.signal(); }

private:
    Koru::Event stopping_;
};

int main() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr); // before any thread is started

    Worker worker;
    if (!worker.start(nullptr)) return 1;
    kill(getpid(), SIGTERM); // In real life, somebody else sends it.
    int signal = 0;
    sigwait(&signals, &signal);
    worker.stop();
    worker.join();
    std::cout << (signal == SIGTERM ? "stopped by SIGTERM" : "stopped by SIGINT") << '\n';
}
