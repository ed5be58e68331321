// zuvo-devserver: a local server that speaks the video service's and the account service's
// protocol, for the demo, the tests and the benchmark. Command line, signals and the help text.
//
// Request log (--log FILE): one JSON object per line, appended and flushed per request. A
// request that is answered is logged just before its answer is sent (so a client that holds
// the answer finds the line); a request that ends without an answer (cut by a fault, closed by
// the client, superseded) is logged when its connection is done with it. Members, in order:
//   seq          number of the request since start (1, 2, ...)
//   time         wall-clock seconds since the epoch, three decimals
//   scheme       "http" or "https" (the listener)
//   remote       client "address:port"
//   method, target (path and query as received), path, query (raw, without '?'), version
//   kind         meta | data | status | login | token | category | schema | admin | other
//   headers      [[name, value], ...] in the order received, names as sent
//   body_length  body bytes received (for a cut request: the bytes kept)
//   body_sha256  hex SHA-256 of those bytes
//   body         the body as a JSON string, only when shorter than 64 KiB and valid UTF-8
//   body_base64  the body in base64, only when shorter than 64 KiB
//   complete     true when the whole body announced by the request arrived
//   status       the status answered, 0 when none was sent
//   outcome      answered | cut | client-closed | superseded | timeout | shutdown | write-error | error
//   faults       actions of the fault rules that fired for this request, e.g. ["throttle","cut"]
//   upload_id    the upload the request created or addressed, when there is one
#include <fcntl.h>
#include <getopt.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>

#include "zv-devserver.h"

namespace {

using zv_devserver::Config;

const char kUsage[] = R"(Usage: zuvo-devserver --storage DIR [options]

A local server for the upload service's remote side: the metadata upload, the resumable data
upload and its status query, the category document, the client login and the OAuth2 token
endpoint, all on 127.0.0.1 and one port (paths differ). Point the service at it with
ZV_UPLOAD_HOST, ZV_DATA_HOST, ZV_ACCOUNT_HOST and ZV_TOKEN_HOST = 127.0.0.1:PORT.

Options:
  --port N               port on 127.0.0.1 (default 0: a free one). The first line on standard
                         output is always "port N", flushed once the server listens.
  --storage DIR          where uploads are stored (created if missing): ID.data holds the bytes
                         received, ID.atom.xml the metadata document.
  --token T              bearer token the metadata upload accepts; may repeat. Without any,
                         every token (or none) is accepted. The issued token is accepted too.
  --api-key K            API key the metadata upload accepts (header "X-ZvData-Key: key=K");
                         without it any key (or none) is accepted.
  --user EMAIL           e-mail the client login accepts (without it: any)
  --password PW          password the client login accepts (without it: any)
  --client-id ID         OAuth2 client id the token endpoint accepts (without it: any)
  --client-secret S      OAuth2 client secret the token endpoint accepts (without it: any)
  --refresh-token R      refresh token the token endpoint accepts; may repeat (without: any)
  --issued-token T       access token that the login and the token endpoint hand out
                         (default "zv-dev-access-token")
  --log FILE             request log, one JSON object per line (see below)
  --fault RULE           a fault rule, as "kind=data,action=cut,bytes=1000"; may repeat
  --tls-port N           also serve https on this port (0: a free one, printed on the second
                         line as "tls-port N"); needs --tls-cert and --tls-key (PEM files)
  --tls-cert FILE, --tls-key FILE
  --discard-data         count the bytes of data PUTs without storing them (benchmarks: the
                         server then costs little more than reading the socket); the .data
                         files stay empty and /_admin/uploads gives an empty sha256
  --help                 this text

Endpoints (every listener serves all of them):
  POST /resumable/feeds/api/users/default/uploads   metadata upload: checks the bearer token
        (401) and the API key (403), stores the body, answers 201 with
        "Location: http://HOST/resumable/uploads/ID" (HOST as the client addressed us).
  PUT  /resumable/uploads/ID with "Content-Range: bytes A-B/T": accepted only when A is the next
        byte the upload lacks (else 416); answers 308 with "Range: bytes=0-N" while incomplete,
        201 with the ETag header (the upload id in double quotes) and the Range when complete,
        200 the same for a PUT to a complete upload. A body cut short keeps the bytes that arrived. Without Content-Range
        the body is the whole file (curl -T). A new PUT or a status query takes the upload over
        from a PUT still in flight, which writes no more.
  PUT  /resumable/uploads/ID with "Content-Range: bytes */*" (status query): 308 with
        "Range: bytes=0-N", or 308 without Range when nothing is held; 200 with ETag and the
        Range when complete.
  POST /accounts/ClientLogin   form Email, Passwd: 200 with {"Auth": "TOKEN", ...}, else 403.
  POST /o/oauth2/token         form client_id, client_secret, refresh_token,
        grant_type=refresh_token: 200 with {"access_token": "TOKEN", ...}; errors as OAuth2 JSON
        (400 invalid_grant for an unknown refresh token, 401 invalid_client, ...).
  GET  /schemas/2007/categories.cat[?hl=LANG]   category document (en, ko, de, fr, es, ja;
        "ko-KR" and "ko_KR" count as ko); 404 for another language.
  GET  /schemas/2007           the schema namespace document.
Admin (loopback only):
  POST   /_admin/fault         add a fault rule from the query, a form body or a flat JSON
                               object; 201 {"id":N}, 400 {"error":"..."}
  GET    /_admin/faults        the rules with their counters "seen" and "fired"
  DELETE /_admin/faults        remove every rule
  GET    /_admin/uploads       [{"id","url","slug","total","held","complete","path","meta_path",
                               "sha256"}...] in creation order; /_admin/uploads/ID for one

Fault rules: kind = any|meta|data|status|login|token|category|schema|other (a request's kind is
counted per rule from the moment the rule exists); nth = N (default 1: the next request of that
kind) and times = M (default 1; 0: every one from the N-th on) choose the requests it acts on;
action is one of
  status     status=S [body=TEXT]  answer S instead of serving the request (a body is read and
                                   dropped; with "Expect: 100-continue" it is never sent)
  cut        bytes=K               close the connection without an answer once more than K body
                                   bytes arrived, keeping exactly K; K=0 closes at the headers
  throttle   rate=R                read the body at R bytes per second
  stall      seconds=T             wait T seconds before the answer
  nolocation                       answer a metadata upload without its Location header
  bigheader  [bytes=N]             send the answer with a header block of N bytes (default
                                   6291456, over the client's 5242880 limit); plain http only
                                   (on https the connection is closed)

Request log (--log): one JSON object per line; members seq, time, scheme, remote, method,
target, path, query, version, kind, headers ([[name,value],...] in the order received),
body_length, body_sha256, body (text, when < 64 KiB and UTF-8), body_base64 (when < 64 KiB),
complete, status (0: no answer), outcome (answered, cut, client-closed, superseded, timeout,
shutdown, write-error, error), faults (actions that fired) and upload_id. An answered request is
logged just before its answer is sent.

SIGTERM or SIGINT stops the server; it exits 0.
)";

[[noreturn]] void usage_error(const std::string &message)
{
    fprintf(stderr, "zuvo-devserver: %s (see --help)\n", message.c_str());
    exit(2);
}

int parse_port(const char *option, const char *text)
{
    char *end = nullptr;
    errno = 0;
    long v = strtol(text, &end, 10);
    if (errno != 0 || *end != '\0' || end == text || v < 0 || v > 65535)
        usage_error(std::string("--") + option + " needs a port number from 0 to 65535, not \"" + text + "\"");
    return static_cast<int>(v);
}

bool read_text(const std::string &path, std::string *out)
{
    std::ifstream in(path, std::ios::binary);
    if (!in)
        return false;
    std::stringstream ss;
    ss << in.rdbuf();
    *out = ss.str();
    return true;
}

Config parse_args(int argc, char **argv)
{
    enum {
        kPort = 1000, kStorage, kToken, kApiKey, kUser, kPassword, kClientId, kClientSecret,
        kRefreshToken, kIssuedToken, kLog, kFault, kTlsPort, kTlsCert, kTlsKey, kDiscardData, kHelp,
    };
    static const option options[] = {
        {"port", required_argument, nullptr, kPort},
        {"storage", required_argument, nullptr, kStorage},
        {"token", required_argument, nullptr, kToken},
        {"api-key", required_argument, nullptr, kApiKey},
        {"user", required_argument, nullptr, kUser},
        {"password", required_argument, nullptr, kPassword},
        {"client-id", required_argument, nullptr, kClientId},
        {"client-secret", required_argument, nullptr, kClientSecret},
        {"refresh-token", required_argument, nullptr, kRefreshToken},
        {"issued-token", required_argument, nullptr, kIssuedToken},
        {"log", required_argument, nullptr, kLog},
        {"fault", required_argument, nullptr, kFault},
        {"tls-port", required_argument, nullptr, kTlsPort},
        {"tls-cert", required_argument, nullptr, kTlsCert},
        {"tls-key", required_argument, nullptr, kTlsKey},
        {"discard-data", no_argument, nullptr, kDiscardData},
        {"help", no_argument, nullptr, kHelp},
        {nullptr, 0, nullptr, 0},
    };
    Config config;
    std::string cert_path, key_path;
    opterr = 0;
    int c;
    while ((c = getopt_long(argc, argv, ":", options, nullptr)) != -1) {
        switch (c) {
        case kPort: config.port = parse_port("port", optarg); break;
        case kStorage: config.storage = optarg; break;
        case kToken: config.tokens.push_back(optarg); break;
        case kApiKey: config.api_key = optarg; break;
        case kUser: config.user = optarg; break;
        case kPassword: config.password = optarg; break;
        case kClientId: config.client_id = optarg; break;
        case kClientSecret: config.client_secret = optarg; break;
        case kRefreshToken: config.refresh_tokens.push_back(optarg); break;
        case kIssuedToken: config.issued_token = optarg; break;
        case kLog: config.log_path = optarg; break;
        case kFault: config.faults.push_back(zv_devserver::parse_fields(optarg, ",&")); break;
        case kTlsPort: config.tls_port = parse_port("tls-port", optarg); break;
        case kTlsCert: cert_path = optarg; break;
        case kTlsKey: key_path = optarg; break;
        case kDiscardData: config.discard_data = true; break;
        case kHelp:
            fputs(kUsage, stdout);
            exit(0);
        case ':':
            usage_error(std::string(argv[optind - 1]) + " needs a value");
        default:
            usage_error(std::string("unknown option ") + (optind > 0 && optind <= argc ? argv[optind - 1] : "?"));
        }
    }
    if (optind < argc)
        usage_error(std::string("unexpected argument \"") + argv[optind] + "\"");
    if (config.storage.empty())
        usage_error("--storage DIR is required");
    if (config.issued_token.empty())
        usage_error("--issued-token must not be empty");
    zv_devserver::FaultTable check;
    for (const auto &f : config.faults) {
        std::string why;
        if (check.add(f, &why) < 0)
            usage_error("--fault: " + why);
    }
    if (!cert_path.empty() || !key_path.empty() || config.tls_port) {
        if (cert_path.empty() || key_path.empty())
            usage_error("https needs both --tls-cert and --tls-key");
        if (!read_text(cert_path, &config.tls_cert_pem))
            usage_error("cannot read --tls-cert " + cert_path);
        if (!read_text(key_path, &config.tls_key_pem))
            usage_error("cannot read --tls-key " + key_path);
        if (!config.tls_port)
            config.tls_port = 0;
    }
    return config;
}

} // namespace

int main(int argc, char **argv)
{
    Config config = parse_args(argc, argv);

    // Every thread the server starts inherits this mask; the main thread takes the signals.
    sigset_t stop_signals;
    sigemptyset(&stop_signals);
    sigaddset(&stop_signals, SIGTERM);
    sigaddset(&stop_signals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &stop_signals, nullptr);
    signal(SIGPIPE, SIG_IGN);

    zv_devserver::Server server(std::move(config));
    std::string error;
    if (!server.start(&error)) {
        fprintf(stderr, "zuvo-devserver: %s\n", error.c_str());
        return 1;
    }
    printf("port %d\n", server.port());
    if (server.tls_port())
        printf("tls-port %d\n", server.tls_port());
    fflush(stdout);

    int sig = 0;
    while (sigwait(&stop_signals, &sig) != 0) {
    }
    server.stop();
    return 0;
}
