// Request dispatch: replies byte for byte, the unknown-id line, the count around every request,
// nesting of a request inside a running alert, and withdrawal when a client goes away.
#include <QCheckBox>
#include <QDir>
#include <QEvent>
#include <QFile>
#include <QMessageBox>
#include <QPointer>
#include <QTemporaryDir>
#include <QTimer>
#include <atomic>
#include <functional>
#include <thread>

#include "UIAgent/QZLocalizedString.h"
#include "UIAgent/QZUIAgentHandleMessage.h"
#include "UIAgent/QZUIController.h"
#include "protocol/QZUIProtocol.h"
#include "tests/UIAgent/AgentTestSupport.h"
#include "tests/UIAgent/DownloadTestSupport.h"
#include "tests/UIAgent/QtTestEnvironment.h"
#include "tests/support/LogCapture.h"

namespace {

using namespace std::chrono_literals;
using glyphwell::testing::Array;
using glyphwell::testing::Ascii;
using glyphwell::testing::Dict;
using glyphwell::testing::Flattened;
using glyphwell::testing::Hex;
using glyphwell::testing::Join;
using glyphwell::testing::LogCapture;
using glyphwell::testing::Num;
using glyphwell::testing::Ref;
using glyphwell::testing::SpinUntil;
using glyphwell::testing::Str;
using glyphwell::testing::ToHex;

constexpr char kFontPath[] = "/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf";

// Reply pieces, as the clients read them.
const std::vector<uint8_t> kResultKey =
    Join({Hex("00 00 00 07  00 00 00 12"), Ascii("QZUIPropertyResult")});
const std::vector<uint8_t> kSuppressKey =
    Join({Hex("00 00 00 07  00 00 00 14"), Ascii("QZUIPropertySuppress")});
const std::vector<uint8_t> kCandidatesKey =
    Join({Hex("00 00 00 07  00 00 00 1D"), Ascii("QZUIPropertyCandidateFontURLs")});
// A number of type 7 (signed char), one byte wide.
const std::vector<uint8_t> kNo = Hex("00 00 00 16  00 00 00 07  00 00 00 01  00");
const std::vector<uint8_t> kYes = Hex("00 00 00 16  00 00 00 07  00 00 00 01  01");
const std::vector<uint8_t> kOneFontURL =
    Join({Hex("00 00 00 11  00 00 00 01  00 00 01 01  00 00 00 36"),
          Ascii("file:///usr/share/fonts/truetype/dejavu/DejaVuSans.ttf")});

std::string Expected(std::initializer_list<std::vector<uint8_t>> pieces) {
    return ToHex(Join(pieces));
}

/// Once an alert other than `notThis` is up, runs `action` with it (once).
void WhenAlertAppears(QWidget* notThis, std::function<void(QMessageBox*)> action) {
    auto* poll = new QTimer;
    QObject::connect(poll, &QTimer::timeout, [poll, notThis, action] {
        QMessageBox* alert = glyphwell::testing::AlertOnScreen();
        if (!alert || alert == notThis || !alert->isVisible())
            return;
        poll->stop();
        poll->deleteLater();
        action(alert);
    });
    poll->start(10);
}

void Click(QMessageBox* alert, const char* key) {
    QAbstractButton* button = glyphwell::testing::ButtonWithText(alert, QZLocalizedString(key));
    ASSERT_NE(button, nullptr) << key;
    button->click();
}

class DispatchTest : public ::testing::Test {
protected:
    DispatchTest() {
        controller_.setIdleDelay(60s);
        QObject::connect(&controller_, &QZUIController::alertCountChanged, [this](qint64 count) {
            counts_.push_back(count);
            timerArmed_.push_back(controller_.terminateTimer() != nullptr);
        });
    }

    /// Handles `request` (a value to flatten, or null for no bytes) as message `msgid`.
    Ref Handle(SInt32 msgid, CFTypeRef request) {
        Ref bytes = request ? Flattened(request) : Ref();
        return Ref(QZUIAgentHandleMessage(nullptr, msgid, bytes.as<CFDataRef>(), &controller_));
    }

    /// A message id 1 request naming the DejaVu Sans file as its one candidate.
    static Ref ActivationRequest(const std::string& application) {
        Ref url(CFURLCreateWithFileSystemPath(nullptr, Str(kFontPath).as<CFStringRef>(),
                                              kCFURLPOSIXPathStyle, false));
        Ref candidates = Array({url.get()});
        Ref name = Str(application);
        Ref font = Str("DejaVuSans");
        return Dict({{kQZUIPropertyApplicationName, name.get()},
                     {kQZUIPropertyFontName, font.get()},
                     {kQZUIPropertyCandidateFontURLs, candidates.get()}});
    }

    glyphwell::testing::AgentPortEnvironment environment_;
    QZUIController controller_;
    std::vector<qint64> counts_;
    std::vector<bool> timerArmed_;
};

TEST_F(DispatchTest, UnknownIdsAreLoggedSignWidenedAndAnsweredWithNoBytes) {
    LogCapture log;
    Ref request = Dict({});
    Ref three = Handle(3, request.get());
    Ref minusOne = Handle(-1, nullptr);
    Ref lowest = Handle(INT32_MIN, nullptr);
    EXPECT_EQ(CFDataGetLength(three.as<CFDataRef>()), 0);
    EXPECT_EQ(CFDataGetLength(minusOne.as<CFDataRef>()), 0);
    std::vector<std::string> unknownLines;
    for (const std::string& line : log.Texts())
        if (line.rfind("unknown msgid", 0) == 0)
            unknownLines.push_back(line);
    EXPECT_EQ(unknownLines,
              (std::vector<std::string>{"unknown msgid: 3", "unknown msgid: 18446744073709551615",
                                        "unknown msgid: 18446744071562067968"}));
    // Every request, known or not, is counted and restarts the idle period.
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 0, 1, 0, 1, 0}));
    EXPECT_EQ(timerArmed_, (std::vector<bool>{false, true, false, true, false, true}));
}

TEST_F(DispatchTest, RequestsWithNothingToAskAreAnsweredAtOnceWithoutAWindow) {
    using glyphwell::testing::DownloadReply;
    using glyphwell::testing::RequestedFont;
    const std::string noWithEmptyArray =
        Expected({Hex("00 00 00 10  00 00 00 03"), kResultKey, kNo, kSuppressKey, kNo,
                  kCandidatesKey, Hex("00 00 00 11  00 00 00 00")});
    Ref font = Str("Example-Regular");
    Ref unknownFont = RequestedFont("NoSuchFont-Regular");
    Ref nameless = Dict({{NSFontFamilyAttribute, font.get()}});
    Ref one = Num(kCFNumberSInt32Type, SInt32(1));
    Ref empty = Array({});
    struct Case {
        SInt32 msgid;
        Ref request;
        std::string reply;
    } cases[] = {
        {2, Ref(), DownloadReply(false, false)},
        {2, Str("QZUIPropertySuppress"), DownloadReply(false, false)},
        // Nothing any catalog offers: no confirmation.
        {2, Dict({{kQZUIPropertyFontProperties, Array({unknownFont.get()}).get()}}),
         DownloadReply(false, false)},
        // Not to be asked, with no font named (or a number that answers true as the flag):
        // nothing is downloaded or matched, and the flag is passed back.
        {2,
         Dict({{kQZUIPropertySuppress, kCFBooleanTrue},
               {kQZUIPropertyFontProperties, Array({nameless.get()}).get()}}),
         DownloadReply(false, true)},
        {2, Dict({{kQZUIPropertySuppress, one.get()}}), DownloadReply(false, true)},
        // Message id 1 without candidates: no, with an empty candidate array.
        {1, Ref(), noWithEmptyArray},
        {1, Dict({{kQZUIPropertyFontName, font.get()}}), noWithEmptyArray},
        {1, Dict({{kQZUIPropertyCandidateFontURLs, empty.get()}}), noWithEmptyArray},
        {1, Dict({{kQZUIPropertyCandidateFontURLs, font.get()}}), noWithEmptyArray},
    };
    glyphwell::testing::WindowWatch shown;
    for (const Case& c : cases)
        EXPECT_EQ(ToHex(Handle(c.msgid, c.request.get()).as<CFDataRef>()), c.reply) << c.msgid;
    EXPECT_EQ(shown.windowsShown, 0);
    EXPECT_EQ(counts_.back(), 0);
}

TEST_F(DispatchTest, AnActivationAnswerCarriesTheChoiceTheCheckboxAndTheCandidates) {
    Ref request = ActivationRequest("Example Editor");
    WhenAlertAppears(nullptr, [](QMessageBox* alert) {
        ASSERT_NE(alert->checkBox(), nullptr);
        alert->checkBox()->setChecked(true);
        Click(alert, "QZ_BUTTON_ALLOW");
    });
    EXPECT_EQ(ToHex(Handle(1, request.get()).as<CFDataRef>()),
              Expected({Hex("00 00 00 10  00 00 00 03"), kResultKey, kYes, kSuppressKey, kYes,
                        kCandidatesKey, kOneFontURL}));

    WhenAlertAppears(nullptr, [](QMessageBox* alert) { Click(alert, "QZ_BUTTON_DISALLOW"); });
    EXPECT_EQ(ToHex(Handle(1, request.get()).as<CFDataRef>()),
              Expected({Hex("00 00 00 10  00 00 00 03"), kResultKey, kNo, kSuppressKey, kNo,
                        kCandidatesKey, kOneFontURL}));
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 0, 1, 0}));
}

TEST_F(DispatchTest, ARequestArrivingWhileAnAlertIsUpIsHandledInsideItAndAnsweredFirst) {
    Ref outerRequest = ActivationRequest("Outer Application");
    Ref innerRequest = ActivationRequest("Inner Application");
    std::vector<std::string> events;
    std::string innerReply;
    WhenAlertAppears(nullptr, [&](QMessageBox* outer) {
        WhenAlertAppears(outer, [&](QMessageBox* inner) {
            events.push_back("inner alert up at count " + std::to_string(controller_.alertCount()));
            Click(inner, "QZ_BUTTON_ALLOW");
        });
        Ref inner = Handle(1, innerRequest.get());
        innerReply = ToHex(inner.as<CFDataRef>());
        events.push_back("inner reply");
        EXPECT_EQ(glyphwell::testing::AlertOnScreen(), outer);
        Click(outer, "QZ_BUTTON_DISALLOW");
    });
    Ref outer = Handle(1, outerRequest.get());
    events.push_back("outer reply");

    EXPECT_EQ(events, (std::vector<std::string>{"inner alert up at count 2", "inner reply",
                                                "outer reply"}));
    EXPECT_EQ(innerReply, Expected({Hex("00 00 00 10  00 00 00 03"), kResultKey, kYes, kSuppressKey,
                                    kNo, kCandidatesKey, kOneFontURL}));
    EXPECT_EQ(ToHex(outer.as<CFDataRef>()),
              Expected({Hex("00 00 00 10  00 00 00 03"), kResultKey, kNo, kSuppressKey, kNo,
                        kCandidatesKey, kOneFontURL}));
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 2, 1, 0}));
    EXPECT_EQ(timerArmed_, (std::vector<bool>{false, false, false, true}));
}

TEST_F(DispatchTest, FontDescriptorsCarryOnlyTheNameAndSkipElementsWithoutOne) {
    Ref regular = Str("Example-Regular");
    Ref bold = Str("Example-Bold");
    Ref family = Str("Example");
    Ref seven = Num(kCFNumberSInt32Type, SInt32(7));
    Ref full = Dict({{NSFontNameAttribute, regular.get()}, {NSFontFamilyAttribute, family.get()}});
    Ref nameless = Dict({{NSFontFamilyAttribute, family.get()}});
    Ref numberName = Dict({{NSFontNameAttribute, seven.get()}});
    Ref plain = Dict({{NSFontNameAttribute, bold.get()}});
    Ref fonts = Array({full.get(), nameless.get(), family.get(), numberName.get(), plain.get()});
    Ref request = Dict({{kQZUIPropertyFontProperties, fonts.get()}});

    Ref descriptors(QZCreateFontDescriptors(request.as<CFDictionaryRef>()));
    Ref regularOnly = Dict({{NSFontNameAttribute, regular.get()}});
    Ref expected = Array({regularOnly.get(), plain.get()});
    EXPECT_TRUE(CFEqual(descriptors.get(), expected.get()));

    Ref none(QZCreateFontDescriptors(nullptr));
    EXPECT_EQ(CFArrayGetCount(none.as<CFArrayRef>()), 0);
}

/// Sends `request` as message `msgid` from another thread, through the agent's socket.
class Client {
public:
    Client(SInt32 msgid, CFTypeRef request, CFTimeInterval receiveTimeout)
        : bytes_(Flattened(request)) {
        thread_ = std::thread([this, msgid, receiveTimeout] {
            CFMessagePortRef remote = CFMessagePortCreateRemote(nullptr, kQZUIAgentPortName);
            if (remote) {
                status_ = CFMessagePortSendRequest(remote, msgid, bytes_.as<CFDataRef>(), 5,
                                                   receiveTimeout, kCFRunLoopDefaultMode, &reply_);
                CFMessagePortInvalidate(remote);
                CFRelease(remote);
            }
            done_ = true;
        });
    }
    ~Client() {
        if (thread_.joinable())
            thread_.join();
        if (reply_)
            CFRelease(reply_);
    }
    bool Done() const { return done_; }
    SInt32 Status() const { return status_; }
    CFDataRef Reply() const { return reply_; }

private:
    Ref bytes_;
    std::thread thread_;
    std::atomic<bool> done_{false};
    SInt32 status_ = 1;
    CFDataRef reply_ = nullptr;
};

TEST_F(DispatchTest, AClientThatGivesUpWithdrawsItsQuestionAndTheOthersGoOn) {
    controller_.applicationWillFinishLaunching();
    ASSERT_NE(controller_.messagePort(), nullptr);
    Ref outerRequest = ActivationRequest("Impatient Application");
    Ref innerRequest = ActivationRequest("Patient Application");

    // Requests are handled inside whatever loop runs, so the test acts from the event loop.
    std::unique_ptr<Client> patient;
    QPointer<QMessageBox> outerAlert;
    bool innerUpWhenOuterWent = false;
    qint64 countWhenOuterWent = 0;
    WhenAlertAppears(nullptr, [&](QMessageBox* outer) {
        outerAlert = outer;
        patient = std::make_unique<Client>(1, innerRequest.get(), kCFMessagePortWaitForever);
        WhenAlertAppears(outer, [&](QMessageBox* inner) {
            // The impatient client gives up: its alert goes at once, the other one stays.
            auto* poll = new QTimer;
            QObject::connect(poll, &QTimer::timeout, [&, poll, inner] {
                if (outerAlert && outerAlert->isVisible())
                    return;
                poll->stop();
                poll->deleteLater();
                innerUpWhenOuterWent = inner->isVisible();
                countWhenOuterWent = controller_.alertCount();
                Click(inner, "QZ_BUTTON_ALLOW");
            });
            poll->start(10);
        });
    });
    // The impatient client waits 1.5 s for its answer, then closes its connection.
    Client impatient(1, outerRequest.get(), 1.5);
    ASSERT_TRUE(SpinUntil(
        [&] {
            return impatient.Done() && patient && patient->Done() && controller_.alertCount() == 0;
        },
        20s));

    EXPECT_TRUE(innerUpWhenOuterWent);
    EXPECT_EQ(countWhenOuterWent, 2);
    EXPECT_EQ(impatient.Status(), kCFMessagePortReceiveTimeout);
    EXPECT_EQ(patient->Status(), kCFMessagePortSuccess);
    ASSERT_NE(patient->Reply(), nullptr);
    EXPECT_EQ(ToHex(patient->Reply()), Expected({Hex("00 00 00 10  00 00 00 03"), kResultKey, kYes,
                                                 kSuppressKey, kNo, kCandidatesKey, kOneFontURL}));
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 2, 1, 0}));
}

} // namespace
