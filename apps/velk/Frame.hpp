// The base of every screen: a window with a modal key loop, the key reader
// that carries the idle dimming and timeout, the signal pipe, and the
// console's login state.
#pragma once

#include <signal.h>
#include <sys/time.h>

#include <atomic>
#include <functional>
#include <string>

#include "Window.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

class StringFactory;

// Thrown out of GetKey when the idle timeout expires; unwinds every modal
// frame back to the welcome window.
struct VelkTimeout {};

class Frame : public Window {
public:
    Frame(Frame* parent, int x, int y, int width, int height, int bg, int fg);
    ~Frame() override;

    virtual int Run() = 0;
    virtual void Update() {}

    int Execute();
    // The next key. With `tickMillis` > 0 it gives up after that long without
    // a key and returns EV_TIMEOUT (a screen that counts down); otherwise the
    // console waits without waking up.
    int GetKey(bool useIdleTimeout, long tickMillis = 0);

    static int WaitForInput(struct timeval* timeout);
    static void StartSignalHandling();
    static void* SignalHandler(void*);
    static void ResizeTerminal();
    static void LoadIdleTimeout();
    static void SetLoggedIn(bool loggedIn);
    static void SetLoginName(const std::string& name);
    static std::string GetSmartCardUserId();
    static bool IsSmartCardPresent(const std::string& userId);
    static void CheckSmartCard();

    // Children the console does not wait for at once: each is reaped as soon
    // as it ends (no zombie stays behind) and reported to _childExitHandler.
    // Those marked killAtExit are killed and reaped when the console ends.
    static void WatchChild(pid_t pid, bool killAtExit);
    static void ReapWatchedChildren();
    // Told of each watched child that ended (pid, raw wait status); while one
    // is set, GetKey also returns EV_CHILD after a child ended, so that a
    // screen waiting for a child can look again.
    static std::function<void(pid_t, int)> _childExitHandler;

    // Run once before the console ends on a signal, a hang-up, the end of its
    // input or a removed smart card, while set (a network change on trial is
    // put back). The last resort after a termination signal waits for it, up
    // to half a minute.
    static std::function<void()> _atEnd;

    // A termination signal (or a resize) while the console waits for a child
    // must still end it promptly. The child the console waits for in the
    // foreground (a host tool, the pager) is registered here: the signal
    // thread asks it to end, and the waiting code calls EndIfRequested once
    // it is gone. Pass 0 when the wait is over.
    static void SetForegroundChild(pid_t pid);
    static bool EndRequested();
    // Ends the console (status 0) if a termination or resize arrived; the
    // resize is logged first, as in GetKey.
    static void EndIfRequested();

    // Says that the terminal is smaller than the screens need, then only
    // answers signals: no screen is drawn and no key is taken. A resize ends
    // the console, whose supervisor starts it again at the new size.
    [[noreturn]] static void RefuseSmallTerminal();

    // Event codes of WaitForInput.
    enum Event {
        EV_ERROR = -1,
        EV_TIMEOUT = -2,
        EV_REFRESH = -3,
        EV_RESTART = -4,
        EV_RESIZE = -5,
        EV_TERMINATE = -6,
        EV_CHILD = -7,
        EV_HANGUP = -8
    };

    static Frame* fgFrame;
    static sigset_t _signalSet;
    static int _signalPipe[2];
    static QelCtl::Hardware::SmartCardInfoImpl _cardInfo;
    static bool _isLoggedWithSmartCard;
    static std::string _smartCardLoginId;
    static std::string _loginName;
    static bool _loggedIn;
    static bool _markForRestart;
    static unsigned int _idleTimeout;

private:
    static void RunAtEnd();
    static void RequestEnd(int event);
    // Ends the console (status 0) for an ending event: a resize is adopted
    // and logged, a hang-up logged.
    [[noreturn]] static void End(int event);
    static void ArmEmergencyExit();
    // 0 while the terminal may still give keys; else the event that ends
    // the console (EV_HANGUP for a hung-up terminal).
    static int EndOfInput();
    static bool InputWaiting();

protected:
    Frame* _parent;
    StringFactory* _factory;
};

}  // namespace Velk
