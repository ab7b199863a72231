// The system web server and the ports of the machine, as the reference platform sees them.
#pragma once

namespace WebUtils {
// Whether any TCP port from `from` to `to` (inclusive) is taken: a socket of this machine
// listens on it, an installed package declared it as its admin port, or a protocol file
// of /usr/local/etc/services.d declares it for tcp (corv/service_conf.h). `protocol`
// ("http", "https", ...) is carried over TCP in every case.
bool IsPortConflict(const char* protocol, int from, int to);
}  // namespace WebUtils

namespace corvw3 {

// The system's own web server. Its ports come from /etc/corvinfo.conf keys "http_port"
// and "https_port", 5000 and 5001 when those are not set.
class Engine {
  public:
    Engine();
    // Regenerates the web server's configuration (NginxConfManager) and reloads the web
    // server when it runs. True when both went well; false with the error slot set.
    bool W3FwReGenAll();
    // Reloads the firewall rules (CORVFwRuleHup). True on success.
    bool HupFirewall();
};

class NOS {
  public:
    explicit NOS(Engine* engine);
    int GetHttpPort() const;
    int GetHttpsPort() const;

  private:
    Engine* engine_;
};

}  // namespace corvw3
