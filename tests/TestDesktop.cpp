#include "ModalHelper.h"
#include "TemporaryRoot.h"
#include "TestMain.h"
#include "app/VexHelpMenu.h"
#include "app/VexIcon.h"
#include "app/VexIntegration.h"

#include <QAction>
#include <QDir>
#include <QFile>
#include <QImage>
#include <QPainter>
#include <QSettings>
#include <QTemporaryDir>
#include <QWidget>

namespace {

const QRgb baseColour = qRgb(0, 0, 255);
const QRgb emblemColour = qRgb(255, 0, 0);

bool writeSolidPng(const QString &path, QRgb colour)
{
    QImage image(32, 32, QImage::Format_ARGB32);
    image.fill(colour);
    return QDir().mkpath(QFileInfo(path).path()) && image.save(path, "PNG");
}

} // namespace

class TestDesktop : public QObject
{
    Q_OBJECT

private Q_SLOTS:
    void initTestCase()
    {
        QVERIFY(m_dir.isValid());
        QSettings::setPath(QSettings::NativeFormat, QSettings::UserScope, m_dir.filePath(QStringLiteral("/settings")));
        vexInit("9.8.7", "Describes <the> program");

        // A theme with a plain base icon and an emblem of another colour.
        const QString theme = m_dir.filePath(QStringLiteral("/icons/testtheme"));
        QVERIFY(m_dir.writeFile(
            QStringLiteral("/icons/testtheme/index.theme"),
            "[Icon Theme]\nName=testtheme\nDirectories=32x32/apps\n\n[32x32/apps]\nSize=32\nType=Fixed\n"));
        QVERIFY(writeSolidPng(theme + QStringLiteral("/32x32/apps/user.png"), baseColour));
        QVERIFY(writeSolidPng(theme + QStringLiteral("/32x32/apps/emblem-system.png"), emblemColour));
        QIcon::setThemeSearchPaths({m_dir.filePath(QStringLiteral("/icons"))});
        QIcon::setThemeName(QStringLiteral("testtheme"));
    }

    void cleanup()
    {
        QCOMPARE(ModalHelper::shownWindow(), QString());
    }

    void iconResources_data()
    {
        QTest::addColumn<int>("size");
        const char *const icons[] = {"arrow_right",      "email",          "exit",        "ftp_command",
                                     "move_left",        "move_right",     "option_item", "pixel/adduser",
                                     "pixel/deleteuser", "pixel/edituser", "pixel/save",  "pixel/start",
                                     "pixel/stop",       "user_gray",      "user_green",  "user_red"};
        for (const char *icon : icons)
            QTest::newRow(icon) << 32;
        QTest::newRow("app-icon") << 64;
    }

    // Every name the program uses is compiled in and holds a drawing: not
    // empty, not a filled square.
    void iconResources()
    {
        QFETCH(int, size);
        const QImage image(QStringLiteral(":/prefix/icons/%1.png").arg(QLatin1String(QTest::currentDataTag())));
        QVERIFY(!image.isNull());
        QCOMPARE(image.size(), QSize(size, size));
        int opaque = 0;
        for (int y = 0; y < size; ++y) {
            for (int x = 0; x < size; ++x)
                opaque += qAlpha(image.pixel(x, y)) == 255;
        }
        QVERIFY2(opaque > size * size / 10, "nearly empty");
        QVERIFY2(opaque < size * size, "no transparent background");
    }

    void emblemIcons_data()
    {
        QTest::addColumn<QString>("emblem");
        QTest::addColumn<int>("size");
        QTest::addColumn<bool>("fallback"); // the base is not in the theme
        QTest::addColumn<QRgb>("topLeft");
        QTest::addColumn<QRgb>("bottomRight");

        QTest::newRow("emblem 32") << "emblem-system" << 32 << false << baseColour << emblemColour;
        QTest::newRow("emblem 16") << "emblem-system" << 16 << false << baseColour << emblemColour;
        QTest::newRow("emblem 48, base only 32") << "emblem-system" << 48 << false << baseColour << emblemColour;
        QTest::newRow("emblem not in theme") << "emblem-unreadable" << 32 << false << baseColour << baseColour;
        QTest::newRow("base not in theme") << "emblem-system" << 32 << true << 0u << 0u;
    }

    void emblemIcons()
    {
        QFETCH(QString, emblem);
        QFETCH(int, size);
        QFETCH(bool, fallback);
        QFETCH(QRgb, topLeft);
        QFETCH(QRgb, bottomRight);

        const QIcon fallbackIcon(QStringLiteral(":/prefix/icons/user_gray.png"));
        const QIcon icon = VexIcon::fromTheme(fallback ? QStringLiteral("no-such-user") : QStringLiteral("user"),
                                              emblem, fallbackIcon);
        const QImage image = icon.pixmap(size).toImage().convertToFormat(QImage::Format_RGB32);
        if (fallback) {
            QCOMPARE(image, fallbackIcon.pixmap(size).toImage().convertToFormat(QImage::Format_RGB32));
            return;
        }
        // The base is drawn no larger than the theme has it.
        const int drawn = qMin(size, 32);
        QCOMPARE(image.size(), QSize(drawn, drawn));
        QCOMPARE(image.pixel(1, 1), topLeft);
        QCOMPARE(image.pixel(drawn / 2 - 2, drawn - 2), baseColour);
        QCOMPARE(image.pixel(drawn - 2, drawn - 2), bottomRight);
    }

    void aboutBox()
    {
        VexHelpMenu menu;
        QCOMPARE(menu.title(), QStringLiteral("Help"));
        ModalHelper modal;
        modal.expect(QString(), QStringLiteral("OK"));
        menu.aboutAction()->trigger();
        QVERIFY2(modal.done(), qPrintable(modal.report()));
        const QString text = modal.seen().first().text;
        QVERIFY2(text.contains(QStringLiteral("ftpconfig 9.8.7")), qPrintable(text));
        QVERIFY2(text.contains(QStringLiteral("Describes &lt;the&gt; program")), qPrintable(text));
        QVERIFY2(text.contains(QStringLiteral("running on Qt ") + QLatin1String(qVersion())), qPrintable(text));
    }

    void geometry()
    {
        QWidget first;
        QVERIFY(!vexRestoreGeometry(&first, QStringLiteral("editor")));
        first.setGeometry(40, 50, 321, 234);
        vexSaveGeometry(&first, QStringLiteral("editor"));
        first.setGeometry(10, 10, 100, 100);
        vexSaveGeometry(&first, QStringLiteral("other"));

        QWidget second;
        QVERIFY(vexRestoreGeometry(&second, QStringLiteral("editor")));
        QCOMPARE(second.geometry().size(), QSize(321, 234));
        // Each key keeps its own; the settings live under the fixed scope.
        QVERIFY(QSettings().contains(QStringLiteral("geometry/other")));
        QCOMPARE(QSettings().fileName(), m_dir.filePath(QStringLiteral("/settings/ftpconfig/ftpconfig.conf")));
    }

private:
    TemporaryRoot m_dir;
};

FTPCONFIG_TEST_MAIN(TestDesktop)
#include "TestDesktop.moc"
