#include "tools/lan/SocketListener.h"

#include <cstring>

#include "tools/lan/Config.h"
#include "tools/lan/Gateway.h"
#include "tools/lan/LineReader.h"

namespace LbPmxLan {

namespace {

// Time a socket client's command or query may take; sockets have no per-call timeout.
constexpr unsigned long SOCKET_IO_TIMEOUT_MS = 5000;
constexpr std::size_t ANSWER_CHUNK = 65536;
constexpr std::size_t MAX_ANSWER = 16 * 1048576;

// Reads one whole answer; false when none came.
bool readAnswer(CLink& link, CConnection& connection, std::string& answer)
{
    answer.clear();
    std::string chunk;
    long reason = 0;
    do {
        if (link.read(
                ANSWER_CHUNK, SOCKET_IO_TIMEOUT_MS, 0, false, -1, [&] { return connection.peerGone(); }, chunk,
                reason) != VXI11_OK) {
            return !answer.empty();
        }
        answer += chunk;
    } while ((reason & 0x04) == 0 && answer.size() < MAX_ANSWER);
    return true;
}

void serveSocket(CGateway& gateway, unsigned index, CConnection& connection, CLanLog& log)
{
    long error = VXI11_OK;
    std::unique_ptr<CLink> link = gateway.open("inst" + std::to_string(index), error);
    if (!link) {
        const char* text =
            error == VXI11_OUT_OF_RESOURCES ? "ERROR: link limit reached\n" : "ERROR: sensor not available\n";
        connection.writeAll(text, std::strlen(text));
        log.line("socket inst%u: %s refused (error %ld)", index, connection.peerText().c_str(), error);
        return;
    }
    log.line("socket inst%u: %s connected", index, connection.peerText().c_str());
    CLineReader reader;
    std::string line;
    std::string answer;
    char buffer[4096];
    for (;;) {
        CLineReader::EResult result;
        while ((result = reader.next(line)) == CLineReader::RESULT_LINE) {
            if (line.empty())
                continue;
            std::string command = line + "\n";
            unsigned long written = 0;
            bool answered = false;
            // The write and the read of its answer hold the sensor's turn together, so that
            // another client's query cannot take this answer or slip in between.
            long status = link->beginTurn(SOCKET_IO_TIMEOUT_MS);
            if (status == VXI11_OK) {
                status = link->write(command.data(), command.size(), SOCKET_IO_TIMEOUT_MS, 0, false, written);
                answered = status == VXI11_OK && isQuery(line) && readAnswer(*link, connection, answer);
                link->endTurn();
            }
            if (status != VXI11_OK) {
                log.line("socket inst%u: \"%s\" failed (error %ld)", index, line.c_str(), status);
            }
            if (status != VXI11_OK || (isQuery(line) && !answered)) {
                if (link->sensorGone()) {
                    // Closing tells the client; a new connection gets a session on the sensor.
                    log.line("socket inst%u: %s closed, the sensor's session is gone", index,
                             connection.peerText().c_str());
                    return;
                }
            } else if (answered) {
                answer += '\n';
                if (!connection.writeAll(answer.data(), answer.size()))
                    return;
            }
        }
        if (result == CLineReader::RESULT_MALFORMED) {
            static const char text[] = "ERROR: malformed input\n";
            connection.writeAll(text, sizeof text - 1);
            log.line("socket inst%u: %s sent malformed input, connection closed", index, connection.peerText().c_str());
            return;
        }
        std::size_t n = connection.readSome(buffer, sizeof buffer);
        if (n == 0)
            break;
        reader.feed(buffer, n);
    }
    log.line("socket inst%u: %s disconnected", index, connection.peerText().c_str());
}

} // namespace

CSocketListeners::CSocketListeners(CGateway& gateway, const CLanConfig& config, CLanLog& log)
    : m_cGateway(gateway), m_cConfig(config), m_cLog(log)
{
}

CSocketListeners::~CSocketListeners()
{
    stop();
}

bool CSocketListeners::update()
{
    bool ok = true;
    std::lock_guard<std::mutex> guard(m_cMutex);
    for (const CSensor& sensor : m_cGateway.scan()) {
        unsigned index = sensor.m_nIndex;
        if (m_mapListeners.count(index))
            continue;
        std::unique_ptr<CListener> listener(
            new CListener("socket inst" + std::to_string(index), m_cLog, m_cConfig.m_cAllow, m_cConfig.m_nIdleSeconds));
        CGateway& gateway = m_cGateway;
        CLanLog& log = m_cLog;
        if (!listener->start(m_cConfig.m_strBind, m_cConfig.m_nSocketPort + index,
                             [&gateway, &log, index](CConnection& c) { serveSocket(gateway, index, c, log); })) {
            ok = false;
            continue;
        }
        m_cLog.line("raw socket of inst%u (%s) on %s:%u", index, sensor.m_strSerial.c_str(),
                    m_cConfig.m_strBind.c_str(), listener->port());
        m_mapListeners[index] = std::move(listener);
    }
    return ok;
}

void CSocketListeners::stop()
{
    std::lock_guard<std::mutex> guard(m_cMutex);
    for (auto& entry : m_mapListeners)
        entry.second->stop();
    m_mapListeners.clear();
}

} // namespace LbPmxLan
