#!/usr/bin/env bats
# A front end asks the gate of another machine: two instances of nginx with the configurations of examples/gate, and a
# certificate authority of the test's own.

setup()
{
    for program in nginx openssl curl; do
        command -v $program >/dev/null || skip "there is no $program"
    done
    dir=$BATS_TEST_TMPDIR
    chmod 0755 "$dir"
    export VEMO_REDIRECT_DIR=$dir/session
    "$VEMO_TEST_TOOL" init >/dev/null
    id=$("$VEMO_TEST_TOOL" create --user root --function web --ttl 1h --uses 2 --allow Example.File:get)
    examples=$BATS_TEST_DIRNAME/../../examples/gate
    pids=()
}

teardown()
{
    [ ${#pids[@]} -eq 0 ] || kill "${pids[@]}"
    for pid in "${pids[@]}"; do
        wait "$pid" || true
    done
}

# run_in_background COMMAND...
run_in_background()
{
    "$@" 3>&- 2>>"$dir/log" &
    pids+=($!)
}

# certificate NAME: signed by the authority
certificate()
{
    openssl req -new -newkey rsa:2048 -nodes -keyout "$1.key" -subj "/CN=$1" -addext "subjectAltName=DNS:$1" 2>/dev/null |
        openssl x509 -req -CA authority.pem -CAkey authority.key -CAcreateserial -days 1 -copy_extensions copy \
            -out "$1.pem" 2>/dev/null
}

# free_port: one of 127.0.0.1
free_port()
{
    /usr/bin/python3 -c 'import socket; s = socket.socket(); s.bind(("127.0.0.1", 0)); print(s.getsockname()[1])'
}

# start_nginx NAME SED-SCRIPT: with an example's configuration, changed
start_nginx()
{
    mkdir "$dir/$1"
    sed "$2" "$examples/nginx-$1.conf" >"$dir/$1/server.conf"
    cat >"$dir/$1/nginx.conf" <<END
daemon off;
master_process off;
pid $dir/$1/pid;
error_log $dir/$1/log;
events {}
http {
    access_log off;
    client_body_temp_path $dir/$1/body;
    proxy_temp_path $dir/$1/proxy;
    fastcgi_temp_path $dir/$1/fastcgi;
    uwsgi_temp_path $dir/$1/uwsgi;
    scgi_temp_path $dir/$1/scgi;
    include $dir/$1/server.conf;
}
END
    run_in_background nginx -c "$dir/$1/nginx.conf"
}

# status ARGUMENTS...: of a request
status()
{
    curl -s -o "$dir/body" -w '%{http_code}' --max-time 5 "$@"
}

@test "a front end grants what its certificate and a token allow, and others cannot ask" {
    mkdir "$dir/keys" && cd "$dir/keys"
    openssl req -x509 -newkey rsa:2048 -nodes -keyout authority.key -out authority.pem -days 1 -subj /CN=authority 2>/dev/null
    certificate tokens.example
    certificate front-end
    openssl req -x509 -newkey rsa:2048 -nodes -keyout foreign.key -out foreign.pem -days 1 -subj /CN=foreign 2>/dev/null
    tls=$(free_port)
    front=$(free_port)
    application=$(free_port)
    echo "the page" >"$dir/page"

    run_in_background "$VEMO_TEST_GATE" --socket "$dir/calls" --user nobody --once-header X-Request-Once
    run_in_background /usr/bin/python3 -m http.server --bind 127.0.0.1 --directory "$dir" "$application"
    start_nginx token-machine "s|/run/vemo-access-token-gate/calls.sock|$dir/calls|; s|8443|127.0.0.1:$tls|
        s|/etc/nginx/tokens/server|$dir/keys/tokens.example|; s|/etc/nginx/tokens|$dir/keys|"
    start_nginx front-end "s|tokens.example:8443|127.0.0.1:$tls|; s|8080|127.0.0.1:$front|; s|:8000|:$application|
        s|/etc/nginx/tokens|$dir/keys|"
    for _ in {1..100}; do
        [ "$(status "http://127.0.0.1:$front/page") $(status "http://127.0.0.1:$application/page")" != "401 200" ] || break
        sleep 0.05
    done

    [ "$(status "http://127.0.0.1:$front/page")" = 401 ]
    [ "$(status -H "Authorization: Bearer nobody's" "http://127.0.0.1:$front/page")" = 403 ]
    [ "$(status -H "Authorization: Bearer $id" "http://127.0.0.1:$front/page")" = 200 ]
    [ "$(cat "$dir/body")" = "the page" ]
    # The token machine answers none but its front ends, and nothing but calls.
    ask=(--cacert authority.pem --connect-to "tokens.example:443:127.0.0.1:$tls" -H "Authorization: Bearer $id")
    [ "$(status "${ask[@]}" https://tokens.example/grant/Example.File/get)" = 400 ]
    [ "$(status "${ask[@]}" --cert foreign.pem --key foreign.key https://tokens.example/grant/Example.File/get)" = 400 ]
    [ "$(status "${ask[@]}" --cert front-end.pem --key front-end.key https://tokens.example/metrics)" = 404 ]
    [ "$("$VEMO_TEST_TOOL" show "${id:0:8}" --field count)" = 1 ]

    # Without the gate nothing is granted, and nothing is spent.
    kill "${pids[0]}"
    wait "${pids[0]}" || true
    [ "$(status -H "Authorization: Bearer $id" "http://127.0.0.1:$front/page")" = 500 ]
    [ "$("$VEMO_TEST_TOOL" show "${id:0:8}" --field count)" = 1 ]
    pids=("${pids[@]:1}")
}
