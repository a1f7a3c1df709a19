// Desktop entries (localised keys, the application's name) and volume names from mount tables.
#include <QDir>
#include <QFile>
#include <QTemporaryDir>
#include <sys/sysmacros.h>

#include "desktop/QZDesktopEntry.h"
#include "desktop/QZVolumes.h"
#include "tests/desktop/DesktopTestEnvironment.h"
#include "tests/support/Values.h"

namespace {

using glyphwell::testing::Ref;
using glyphwell::testing::Str;

QString WriteFile(const QString& path, const QByteArray& contents) {
    QFile file(path);
    EXPECT_TRUE(file.open(QIODevice::WriteOnly)) << path.toStdString();
    file.write(contents);
    return path;
}

Ref FileURL(const QString& path) {
    return Ref(CFURLCreateWithFileSystemPath(nullptr, Str(path.toStdString()).as<CFStringRef>(),
                                             kCFURLPOSIXPathStyle, false));
}

TEST(DesktopEntry, LocalizedValuesFollowTheLocaleFallbackOrder) {
    const auto entry = QZDesktopEntry::Parse("[Desktop Entry]\n"
                                             "Name=Writer\n"
                                             "Name[sr]=sr\n"
                                             "Name[sr_RS]=sr_RS\n"
                                             "Name[sr@latin]=sr@latin\n"
                                             "Name[sr_RS@latin]=sr_RS@latin\n");
    ASSERT_TRUE(entry);
    EXPECT_EQ(entry->localizedName("sr_RS.UTF-8@latin"), "sr_RS@latin");
    EXPECT_EQ(entry->localizedName("sr_ME@latin"), "sr@latin");
    EXPECT_EQ(entry->localizedName("sr_RS.UTF-8"), "sr_RS");
    EXPECT_EQ(entry->localizedName("sr_BA"), "sr");
    EXPECT_EQ(entry->localizedName("de_DE"), "Writer");
    EXPECT_EQ(entry->localizedName(""), "Writer");
}

TEST(DesktopEntry, ReadsOnlyTheMainGroupWithEscapesAndTheFirstOfRepeatedKeys) {
    const auto entry = QZDesktopEntry::Parse("# comment\n"
                                             "[Desktop Action new]\n"
                                             "Name=Action\n"
                                             "[Desktop Entry]\r\n"
                                             "Name = Two\\sWords\\\\\\;\r\n"
                                             "Name=Second\n"
                                             "Icon=/opt/writer.png\n"
                                             "no equals sign\n");
    ASSERT_TRUE(entry);
    EXPECT_EQ(entry->name(), "Two Words\\\\;");
    EXPECT_EQ(entry->iconName(), "/opt/writer.png");
    EXPECT_FALSE(QZDesktopEntry::Parse("[Other]\nName=x\n"));
}

TEST(DesktopEntry, LanguageTagsBecomePosixLocales) {
    EXPECT_EQ(QZDesktopEntry::PosixLocaleFromLanguageTag("zh-Hans-CN"), "zh_CN");
    EXPECT_EQ(QZDesktopEntry::PosixLocaleFromLanguageTag("de-DE"), "de_DE");
    EXPECT_EQ(QZDesktopEntry::PosixLocaleFromLanguageTag("es-419"), "es_419");
    EXPECT_EQ(QZDesktopEntry::PosixLocaleFromLanguageTag("fr"), "fr");
}

TEST(ApplicationName, IsTheLocalizedEntryNameElseTheFileNameOfAnExistingFile) {
    QTemporaryDir directory;
    const QString entry = WriteFile(directory.filePath("writer.desktop"),
                                    "[Desktop Entry]\nName=Writer\nName[de]=Schreiber\n");
    const QString unnamed = WriteFile(directory.filePath("unnamed.desktop"), "[Desktop Entry]\n");
    EXPECT_EQ(QZApplicationName(FileURL(entry).as<CFURLRef>(), "de_AT"), "Schreiber");
    EXPECT_EQ(QZApplicationName(FileURL(unnamed).as<CFURLRef>()), "unnamed.desktop");
    EXPECT_EQ(QZApplicationName(FileURL(directory.filePath("gone")).as<CFURLRef>()), "");
    Ref web(CFURLCreateWithString(nullptr, CFSTR("https://example.org/Tool.bin"), nullptr));
    EXPECT_EQ(QZApplicationName(web.as<CFURLRef>()), "");
}

TEST(MountInfo, ParsesEscapesAndTheLongestAndLastStackedMountHoldsAPath) {
    const auto mounts =
        QZParseMountInfo("1 0 8:1 / / rw - ext4 /dev/a rw\n"
                         "garbage line\n"
                         "2 1 8:2 / /media/Fonts\\040Disk rw shared:5 master:1 - vfat /dev/b rw\n"
                         "3 2 8:3 / /media/Fonts\\040Disk/sub rw - ext4 /dev/c rw\n"
                         "4 2 8:4 / /media/Fonts\\040Disk/sub rw - ext4 /dev/d rw\n");
    ASSERT_EQ(mounts.size(), 4u);
    EXPECT_EQ(mounts[1].device, makedev(8, 2));
    EXPECT_EQ(mounts[1].mountPoint, "/media/Fonts Disk");
    EXPECT_EQ(mounts[1].fileSystemType, "vfat");
    EXPECT_EQ(mounts[1].source, "/dev/b");
    EXPECT_EQ(QZMountForCanonicalPath("/media/Fonts Disk/sub/f.ttf", mounts)->mountId, 4);
    EXPECT_EQ(QZMountForCanonicalPath("/media/Fonts Disk/subtle", mounts)->mountId, 2);
    EXPECT_EQ(QZMountForCanonicalPath("/usr/f.ttf", mounts)->mountId, 1);
}

TEST(VolumeName, IsTheLabelElseTheMountPointNameAndNoneOnTheRootFileSystem) {
    QTemporaryDir directory;
    const QString canonical = QFileInfo(directory.path()).canonicalFilePath();
    for (const char* folder : {"by-label", "labelled/fonts", "plain", "bound"})
        QDir(directory.path()).mkpath(folder);
    for (const char* file : {"fake-device", "labelled/fonts/A.ttf", "plain/B.ttf", "bound/C.ttf"})
        WriteFile(directory.filePath(file), "");
    const QString device = directory.filePath("fake-device");
    QFile::link(device, directory.filePath("by-label/Fonts\\x20Disk"));
    const QString table =
        WriteFile(directory.filePath("mountinfo"),
                  QStringLiteral("1 0 8:1 / / rw - ext4 /dev/root rw\n"
                                 "2 1 8:2 / %1/labelled rw - ext4 %2 rw\n"
                                 "3 1 8:3 / %1/plain rw - ext4 /dev/unlabelled rw\n"
                                 "4 1 8:1 /srv %1/bound rw - ext4 /dev/root rw\n")
                      .arg(canonical, device)
                      .toUtf8());
    const QString labels = directory.filePath("by-label");

    EXPECT_EQ(QZNonRootVolumeName(directory.filePath("labelled/fonts/A.ttf"), table, labels),
              "Fonts Disk");
    EXPECT_EQ(QZNonRootVolumeName(directory.filePath("plain/B.ttf"), table, labels), "plain");
    // A bind mount of the root file system is still the system's volume.
    EXPECT_EQ(QZNonRootVolumeName(directory.filePath("bound/C.ttf"), table, labels), "");
    EXPECT_EQ(QZNonRootVolumeName(table, table, labels), "");
    EXPECT_EQ(QZNonRootVolumeName(directory.filePath("missing.ttf"), table, labels), "");
}

} // namespace
