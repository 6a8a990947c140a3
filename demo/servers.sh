# Servers beside the sample service, for scripts/demo --full. Sourced inside of with-avahi, whose network is
# private: the ports are free, and nothing of this machine is reached. They end with the namespace.

kdc_port=8088
realm=ACADEMY.EXAMPLE

# wait_for WHAT COMMAND...: for at most ten seconds
wait_for() {
    local what=$1
    shift
    for _ in $(seq 200); do
        "$@" >/dev/null 2>&1 && return
        sleep 0.05
    done
    echo "demo: $what does not start; see build/demo/servers" >&2
    exit 1
}

start_kdc() {
    local dir=$1
    mkdir "$dir"
    cat >"$dir/krb5.conf" <<END
[libdefaults]
 default_realm = $realm
 dns_lookup_realm = false
 dns_lookup_kdc = false
 dns_canonicalize_hostname = false
 rdns = false
 udp_preference_limit = 1
[realms]
 $realm = {
  kdc = 127.0.0.1:$kdc_port
 }
END
    cat >"$dir/kdc.conf" <<END
[kdcdefaults]
 kdc_listen = 127.0.0.1:$kdc_port
 kdc_tcp_listen = 127.0.0.1:$kdc_port
[realms]
 $realm = {
  database_name = $dir/principal
  key_stash_file = $dir/stash
  acl_file = $dir/kadm5.acl
 }
[logging]
 kdc = FILE:$dir/kdc.log
 admin_server = FILE:$dir/kadmin.log
END
    export KRB5_CONFIG=$dir/krb5.conf KRB5_KDC_PROFILE=$dir/kdc.conf
    kdb5_util create -s -r "$realm" -P master >"$dir/create.log" 2>&1
    krb5kdc -n >"$dir/kdc.out" 2>&1 &
    wait_for "the Kerberos server" bash -c "exec 3<>/dev/tcp/127.0.0.1/$kdc_port"
}

# start_directory DIR LDIF PASSWORD: with the people and groups of the file
start_directory() {
    local dir=$1
    mkdir "$dir" "$dir/db"
    cat >"$dir/slapd.conf" <<END
include /etc/ldap/schema/core.schema
include /etc/ldap/schema/cosine.schema
include /etc/ldap/schema/nis.schema
include /etc/ldap/schema/inetorgperson.schema
modulepath /usr/lib/ldap
moduleload back_mdb
pidfile $dir/pid
argsfile $dir/args
localSSF 128
password-hash {SSHA}
database mdb
suffix "dc=academy,dc=example"
rootdn "cn=admin,dc=academy,dc=example"
rootpw $3
directory $dir/db
access to attrs=userPassword by anonymous auth by * none
access to * by * read
END
    ldap_uri=ldapi://${dir//\//%2F}%2Fsocket
    slapd -d none -f "$dir/slapd.conf" -h "$ldap_uri" >"$dir/slapd.out" 2>&1 &
    wait_for "the directory server" ldapsearch -x -H "$ldap_uri" -b "" -s base
    ldapadd -x -H "$ldap_uri" -D cn=admin,dc=academy,dc=example -y <(printf %s "$3") -e relax -f "$2" >"$dir/add.log"
}

# Announces the grid's controller; /etc/hosts of with-avahi gives its address the name controller.test.example.
start_announcement() {
    avahi-publish -s grid _nimbo._tcp 9000 >"$1" 2>&1 &
    wait_for "the announcement of the controller" grep -q Established "$1"
}
