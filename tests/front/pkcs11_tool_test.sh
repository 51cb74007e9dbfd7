#!/usr/bin/env bash
# pkcs11-tool through the front, the proxy, the service, the bridge and
# SoftHSM2, against pkcs11-tool straight on SoftHSM2 for the same tokens. Run as
# scripts/demo's client: <proxy library> <server id> <user PIN> <file>.
set -uo pipefail
export VOK_SERVER_ID=$2
front=$(dirname "$1")/libvokfront.so
work=$(mktemp -d /tmp/vok-p11tool-XXXXXX)
trap 'rm -rf "$work"' EXIT
failed=0
through() { pkcs11-tool --module "$front" "$@" 2>&1; }
straight() { pkcs11-tool --module /usr/lib/softhsm/libsofthsm2.so "$@" 2>&1; }
report() { # <what> <status> <output shown on failure>
  [ "$2" = 0 ] && echo "ok    $1" && return
  echo "FAIL  $1" && sed 's/^/      /' <<<"$3"
  failed=1
}
says() { # <what> <status> <text> <command...>: the command ends so and says that
  local what=$1 status=$2 text=$3
  shift 3
  out=$("$@")
  [ $? = "$status" ] && grep -qF -- "$text" <<<"$out"
  report "$what" $? "$out"
}
same() { # <what> <filter> <options...>: through the system as straight, both filtered
  local what=$1 filter=$2
  shift 2
  through "$@" | $filter >"$work/through" # one after the other: the same token files
  out=$(straight "$@" | $filter | diff "$work/through" -)
  report "$what" $? "$out"
}
demo=(--token-label vok-demo --login --pin "$3")
fresh=(--token-label fresh --login --pin 5678)

# The system copies a C_GetInfo or C_GetSlotInfo text only when it fits its
# member, and the service's copy of a blank-padded text runs on into the next
# members: the library and slot descriptions stay blank.
no_library() { grep -v '^Library'; }
no_description() { sed 's/^\(Slot [0-9]* (0x[0-9a-f]*):\).*/\1/'; }
same "--show-info, library description aside" no_library --show-info
same "--list-slots, slot descriptions aside" no_description --list-slots
same "--list-mechanisms" cat --list-mechanisms

# A fresh token in SoftHSM2's free slot. C_InitPIN never reaches the module (the
# service knows it by another name and answers nothing), so the user PIN is set
# straight on SoftHSM2.
free=$(through --list-slots | grep -B1 uninitialized | sed -n 's/^Slot.*(\(0x[0-9a-f]*\)).*/\1/p')
says "--init-token" 0 "Token successfully initialized" through --slot "$free" --init-token \
  --label fresh --so-pin 11223344
so=(--token-label fresh --login --login-type so --so-pin 11223344 --init-pin --new-pin 5678)
says "--init-pin fails" 1 "C_InitPIN failed: rv = CKR_DEVICE_ERROR" through "${so[@]}"
says "user PIN set straight" 0 "User PIN successfully initialized" straight "${so[@]}"

# pkcs11-tool's own checks, with one key pair on the token (SoftHSM2 orders keys
# differently in each process). Through the system its first RSA verification,
# in one part, fails (C_Verify never hands the module the signature), and it
# skips the key's other verification mechanisms.
says "--keypairgen EC P-256" 0 "EC_POINT 256 bits" through "${demo[@]}" --keypairgen \
  --key-type EC:prime256v1 --label ec1 --id 01
same "--test with an EC key pair" cat "${demo[@]}" --test
says "--keypairgen RSA-2048" 0 "RSA 2048 bits" through "${fresh[@]}" --keypairgen \
  --key-type rsa:2048 --label rsa1 --id 02
through "${fresh[@]}" --test | tee "$work/test" | sed 's/^/      --test: /'
diff "$work/test" <(straight "${fresh[@]}" --test) | grep '^[<>]' >"$work/differ"
diff - "$work/differ" <<'DIFFER'
<     RSA-X-509:   ERR: verification failed  ERR: C_Verify() returned CKR_SIGNATURE_INVALID (0xc0)
>     RSA-X-509: OK
>     RSA-PKCS: OK
>     SHA1-RSA-PKCS: OK
>     MD5-RSA-PKCS: OK
DIFFER
report "--test with an RSA key pair as straight, but for its one-part verification" $? \
  "$(cat "$work/differ")"

# pkcs11-tool signs and verifies 1 KiB or more in parts, less in one part.
head -c 4096 /dev/urandom >"$work/data"
openssl dgst -sha256 -binary "$work/data" >"$work/digest"
rsa=("${fresh[@]}" --id 02 -m SHA256-RSA-PKCS -i "$work/data")
says "--sign RSA, 4 KiB in parts" 0 "SHA256-RSA-PKCS" through "${rsa[@]}" --sign -o "$work/rsa.sig"
says "--verify RSA, 4 KiB in parts" 0 "Signature is valid" through "${rsa[@]}" --verify \
  --signature-file "$work/rsa.sig"
ec=("${demo[@]}" --id 01 -m ECDSA --signature-format openssl -i "$work/digest")
says "--sign ECDSA over a digest, in one part" 0 "ECDSA" through "${ec[@]}" --sign -o "$work/ec.sig"
says "--verify ECDSA in one part: invalid, never handed the signature" 0 "Invalid signature" \
  through "${ec[@]}" --verify --signature-file "$work/ec.sig"
through "${demo[@]}" --id 01 --read-object --type pubkey -o "$work/ec.der" >/dev/null
says "OpenSSL verifies the ECDSA signature" 0 "Verified Successfully" openssl pkeyutl -verify \
  -pubin -keyform DER -inkey "$work/ec.der" -in "$work/digest" -sigfile "$work/ec.sig"

# Objects, each a block of lines, come in SoftHSM2's order of the process.
objects() { awk '/^[^ ]/ { n++ } { b[n] = b[n] $0 "|" } END { for (i in b) print b[i] }' | sort; }
same "--list-objects of vok-demo, object by object" objects "${demo[@]}" --list-objects
same "--list-objects of fresh, object by object" objects "${fresh[@]}" --list-objects
exit "$failed"
