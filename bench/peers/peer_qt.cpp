// Qt 6's HTTP client: QNetworkAccessManager on a QCoreApplication event loop.
//
//   seq            each GET is sent when the previous one has finished
//   c64, tls64     64 GETs sent at once each round, the next round when all
//                  have finished; HTTP/2 off (Http2AllowedAttribute false).
//                  Qt opens at most 6 connections per host for HTTP/1.1 and
//                  has no setting to change that, so it runs with 6, not 8
//   h2_64          the same with Http2AllowedAttribute: one connection
//
// The server's certificate is checked against --cacert (the request's
// QSslConfiguration holds it as its only CA). No proxy is used, replies are
// deleted by the manager once their finished() has been handled. See
// peer_common.h for the command line and the printed line.
#include <QByteArray>
#include <QCoreApplication>
#include <QList>
#include <QNetworkAccessManager>
#include <QNetworkProxy>
#include <QNetworkReply>
#include <QNetworkRequest>
#include <QSslCertificate>
#include <QSslConfiguration>
#include <QString>
#include <QUrl>
#include <string>
#include <string_view>

#include "peer_common.h"

namespace {

using namespace kivi::bench::peers;

const std::string kClient = "qt";

// Empty when the reply is the expected answer, else what went wrong.
std::string verdict(QNetworkReply* reply) {
  if (reply->error() != QNetworkReply::NoError) return reply->errorString().toStdString();
  const long status = reply->attribute(QNetworkRequest::HttpStatusCodeAttribute).toInt();
  const QByteArray body = reply->readAll();
  const std::string_view text(body.constData(), static_cast<std::size_t>(body.size()));
  if (status == 200 && text == kAnswer) return {};
  return describeAnswer(status, text);
}

}  // namespace

int main(int argc, char** argv) {
  const Options options = parseOptions(kClient, argc, argv);
  QCoreApplication application(argc, argv);
  QNetworkAccessManager manager;
  manager.setProxy(QNetworkProxy::NoProxy);
  manager.setAutoDeleteReplies(true);

  QNetworkRequest request(QUrl(QString::fromStdString(options.url())));
  request.setRawHeader("Content-Type", kContentType);
  request.setRawHeader("Accept", kAccept);
  request.setAttribute(QNetworkRequest::Http2AllowedAttribute, options.mode == Mode::h2_64);
  if (options.https()) {
    const QList<QSslCertificate> trusted =
        QSslCertificate::fromPath(QString::fromStdString(options.cacert));
    if (trusted.isEmpty()) fail(kClient, "no certificate in " + options.cacert);
    QSslConfiguration ssl = QSslConfiguration::defaultConfiguration();
    ssl.setCaCertificates(trusted);
    request.setSslConfiguration(ssl);
  }

  const bool concurrent = isConcurrent(options.mode);
  const int perRound = concurrent ? kConcurrent : 1;
  const int rounds = concurrent ? options.rounds : options.requests;
  Meter meter;
  bool warmingUp = true;
  int round = 0;
  int endedInRound = 0;
  int completed = 0;
  int failures = 0;
  std::string firstFailure;

  auto sendRound = [&](int count) {
    endedInRound = 0;
    for (int i = 0; i < count; ++i) manager.get(request);
  };
  QObject::connect(&manager, &QNetworkAccessManager::finished, [&](QNetworkReply* reply) {
    if (std::string error = verdict(reply); !error.empty() && failures++ == 0) {
      firstFailure = std::move(error);
    }
    if (warmingUp) {
      if (failures != 0) fail(kClient, "warm-up: " + firstFailure);
      warmingUp = false;
      meter.start();
      sendRound(perRound);
      return;
    }
    ++completed;
    if (++endedInRound < perRound) return;
    if (++round < rounds && failures == 0) {
      sendRound(perRound);
      return;
    }
    meter.stop();
    QCoreApplication::quit();
  });
  sendRound(1);
  QCoreApplication::exec();
  return finish(kClient, options, completed, meter, failures, firstFailure);
}
