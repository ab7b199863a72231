// The web server's configuration, regenerated from the package web configurations.
#pragma once

#include <string>

namespace corvw3 {

// Package web configurations are the files /usr/corv/etc/nginx/package.d/*.conf, each one
// or more server blocks (the web-config workers publish them as <pkg>.conf or
// <pkg>-<name>.conf). run() writes /etc/nginx/conf.d/corv-packages.conf, which includes
// them in name order and holds the system web server with the packages' portals (the
// web-config fragments of /usr/corv/etc/www/app.d, see platform/src/app_portal.h),
// through a temporary file and rename, and checks the whole
// configuration with "nginx -t". A configuration that nginx refuses is taken back (the
// previous file returns) and run() fails, so a reload never meets a broken configuration.
class NginxConfManager {
  public:
    // `scope` says what to regenerate; 4, the package configurations, is the one there is.
    explicit NginxConfManager(int scope);
    // 0 when written and accepted; negative with 0x0D00 (unknown scope), 0xD900 (no nginx
    // on this machine), 0x4000 (refused by nginx -t), or the error of the write.
    int run();

    static const char* PackageConfDir();
    static const char* GeneratedPath();

  private:
    int scope_;
};

}  // namespace corvw3
