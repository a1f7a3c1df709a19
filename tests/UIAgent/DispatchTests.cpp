// Request dispatch: replies byte for byte, the unknown-id line and the count around every
// request. A request arriving inside a running alert is the port's test (served nested, answered
// first) and the modal sessions' (the alert above); a client that goes away is the port's test
// (withdrawn) and the question windows' (the alert withdrawn), and the Wayland run does both.
#include <QCheckBox>

#include "UIAgent/QZNetworkCheck.h"
#include "UIAgent/QZUIController.h"
#include "tests/UIAgent/AgentTestSupport.h"
#include "tests/support/LogCapture.h"

namespace {

using namespace std::chrono_literals;
using namespace glyphwell::testing;

// The candidates of a message id 1 reply: the DejaVu Sans file, or none.
const std::vector<uint8_t> kOneFontURL =
    Join({Hex("00 00 00 11  00 00 00 01  00 00 01 01  00 00 00 36"),
          Ascii("file:///usr/share/fonts/truetype/dejavu/DejaVuSans.ttf")});
const std::vector<uint8_t> kNoFontURL = Hex("00 00 00 11  00 00 00 00");

/// Once an alert other than `notThis` is up, runs `action` with it (once).
void WhenAlertAppears(QWidget* notThis, std::function<void(QMessageBox*)> action) {
    auto* poll = new QTimer;
    QObject::connect(poll, &QTimer::timeout, [poll, notThis, action] {
        QMessageBox* alert = AlertOnScreen();
        if (!alert || alert == notThis || !alert->isVisible())
            return;
        poll->deleteLater();
        poll->stop();
        action(alert);
    });
    poll->start(10);
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

    std::string Handle(SInt32 msgid, CFTypeRef request) {
        return HandleRequest(msgid, request, &controller_);
    }

    /// A message id 1 request naming the DejaVu Sans file as its one candidate.
    static Ref ActivationRequest(const std::string& application) {
        Ref candidates = Array(
            {FileURL(QStringLiteral("/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf")).get()});
        return Dict({{kQZUIPropertyApplicationName, Str(application).get()},
                     {kQZUIPropertyFontName, Str("DejaVuSans").get()},
                     {kQZUIPropertyCandidateFontURLs, candidates.get()}});
    }

    AgentPortEnvironment environment_;
    QZUIController controller_;
    std::vector<qint64> counts_;
    std::vector<bool> timerArmed_;
};

TEST_F(DispatchTest, UnknownIdsAreLoggedSignWidenedAndAnsweredWithNoBytes) {
    LogCapture log;
    Ref request = Dict({});
    EXPECT_EQ(Handle(3, request.get()), "");
    EXPECT_EQ(Handle(-1, nullptr), "");
    EXPECT_EQ(Handle(INT32_MIN, nullptr), "");
    EXPECT_EQ(log.Texts(),
              (std::vector<std::string>{"unknown msgid: 3", "unknown msgid: 18446744073709551615",
                                        "unknown msgid: 18446744071562067968"}));
    // Every request, known or not, is counted and restarts the idle period.
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 0, 1, 0, 1, 0}));
    EXPECT_EQ(timerArmed_, (std::vector<bool>{false, true, false, true, false, true}));
}

TEST_F(DispatchTest, RequestsWithNothingToAskAreAnsweredAtOnceWithoutAWindow) {
    Ref font = Str("Example-Regular");
    Ref unknownFont = RequestedFont("NoSuchFont-Regular");
    Ref nameless = Dict({{NSFontFamilyAttribute, font.get()}});
    Ref one = Num(kCFNumberSInt32Type, SInt32(1));
    Ref empty = Array({});
    const std::string noWithoutCandidates = Reply(false, false, kNoFontURL);
    struct Case {
        SInt32 msgid;
        Ref request;
        std::string reply;
    } cases[] = {
        {2, Ref(), Reply(false, false)},
        {2, Str("QZUIPropertySuppress"), Reply(false, false)},
        // Nothing any catalog offers: no confirmation.
        {2, Dict({{kQZUIPropertyFontProperties, Array({unknownFont.get()}).get()}}),
         Reply(false, false)},
        // Not to be asked (a number answers true as the flag): the flag is passed back.
        {2,
         Dict({{kQZUIPropertySuppress, kCFBooleanTrue},
               {kQZUIPropertyFontProperties, Array({nameless.get()}).get()}}),
         Reply(false, true)},
        {2, Dict({{kQZUIPropertySuppress, one.get()}}), Reply(false, true)},
        // Regression: unasked, with no font offered or installed, no (offline) question came up.
        {2, DownloadRequest({unknownFont.get()}, 0, true), Reply(false, true)},
        {2, DownloadRequest({}, 0, true), Reply(false, true)},
        // Message id 1 without candidates: no, with an empty candidate array.
        {1, Ref(), noWithoutCandidates},
        {1, Dict({{kQZUIPropertyFontName, font.get()}}), noWithoutCandidates},
        {1, Dict({{kQZUIPropertyCandidateFontURLs, empty.get()}}), noWithoutCandidates},
        {1, Dict({{kQZUIPropertyCandidateFontURLs, font.get()}}), noWithoutCandidates},
    };
    WindowWatch shown;
    // A question that comes up all the same is closed (and counted) instead of awaited.
    QTimer closer;
    QObject::connect(&closer, &QTimer::timeout, [] {
        if (QMessageBox* alert = AlertOnScreen())
            alert->close();
    });
    closer.start(50);
    QZSetNetworkFlagsSourceForTesting([](QZNetworkReachabilityFlags* flags) {
        *flags = 0;
        return true;
    });
    for (const Case& c : cases)
        EXPECT_EQ(Handle(c.msgid, c.request.get()), c.reply) << c.msgid;
    QZSetNetworkFlagsSourceForTesting(nullptr);
    EXPECT_EQ(shown.windowsShown, 0);
    EXPECT_EQ(counts_.back(), 0);
}

TEST_F(DispatchTest, AnActivationReplyCarriesTheChoiceTheCheckboxAndTheCandidates) {
    Ref request = ActivationRequest("Example Application");
    WhenAlertAppears(nullptr, [&](QMessageBox* alert) {
        ASSERT_NE(alert->checkBox(), nullptr);
        alert->checkBox()->setChecked(true);
        ClickButton(alert, "QZ_BUTTON_ALLOW");
    });
    EXPECT_EQ(Handle(1, request.get()), Reply(true, true, kOneFontURL));
    EXPECT_EQ(counts_, (std::vector<qint64>{1, 0}));
}

TEST_F(DispatchTest, FontDescriptorsCarryOnlyTheNameAndSkipElementsWithoutOne) {
    Ref family = Str("Example");
    Ref full = RequestedFont("Example-Regular", "Example");
    Ref nameless = Dict({{NSFontFamilyAttribute, family.get()}});
    Ref numberName = Dict({{NSFontNameAttribute, Num(kCFNumberSInt32Type, 7).get()}});
    Ref plain = RequestedFont("Example-Bold");
    Ref fonts = Array({full.get(), nameless.get(), family.get(), numberName.get(), plain.get()});
    Ref request = Dict({{kQZUIPropertyFontProperties, fonts.get()}});

    Ref descriptors(QZCreateFontDescriptors(request.as<CFDictionaryRef>()));
    Ref regularOnly = RequestedFont("Example-Regular");
    EXPECT_TRUE(CFEqual(descriptors.get(), Array({regularOnly.get(), plain.get()}).get()));
    Ref none(QZCreateFontDescriptors(nullptr));
    EXPECT_EQ(CFArrayGetCount(none.as<CFArrayRef>()), 0);
}

} // namespace
