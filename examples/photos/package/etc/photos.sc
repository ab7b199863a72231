[photos]
title="Photos"
desc="Photo sharing"
port_forward="yes"
dst.ports="8780/tcp"
