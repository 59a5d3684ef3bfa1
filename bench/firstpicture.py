#!/usr/bin/env python3
"""How long a viewer waits for the first picture of a CT of 1,000 images, from kdd serve and from Orthanc in turn.

    bench/firstpicture.py BUILD-FOLDER VIEWER-FOLDER NODE-MODULES [VISITS]

The viewer's own files come from nginx, which stands before both, so that only the archive differs. Each visit is a
browser of its own that has nothing from an earlier one; the table has the medians [ms] by the page's clock.
"""
import json
import os
import statistics
import subprocess
import sys

from dicomweb import STUDY, make_archive
from servers import Server, add, comparison, free_port, start_kdd, start_peer


def start_front(folder, viewer, server):
    port = free_port()
    place = os.path.join(folder, "front-%d" % port)
    os.mkdir(place)
    config = os.path.join(place, "nginx.conf")
    with open(config, "w") as file:
        file.write("""
daemon off; worker_processes 1; pid %(place)s/pid; error_log %(place)s/errors;
events { }
http {
    include /etc/nginx/mime.types; types { application/wasm wasm; }
    access_log off; client_body_temp_path %(place)s; proxy_temp_path %(place)s; fastcgi_temp_path %(place)s;
    uwsgi_temp_path %(place)s; scgi_temp_path %(place)s;
    upstream archive { server 127.0.0.1:%(server)d; keepalive 8; }
    server {
        listen 127.0.0.1:%(port)d;
        gzip_static on;
        location /viewer/ { alias %(viewer)s/; try_files $uri /viewer/index.html; }
        location /dicom-web/ {
            proxy_pass http://archive; proxy_http_version 1.1; proxy_set_header Connection "";
            proxy_set_header Host 127.0.0.1:%(server)d; proxy_buffering off;
        }
    }
}
""" % {"place": place, "viewer": os.path.abspath(viewer), "server": server.port, "port": port})
    return Server("nginx", ["nginx", "-c", config, "-p", place], port)


def visit(front, modules):
    address = "http://localhost:%d/viewer/viewer?StudyInstanceUIDs=%s" % (front.port, STUDY)
    program = os.path.join(os.path.dirname(os.path.abspath(__file__)), "firstpicture.mjs")
    answer = subprocess.run(["node", program, address], env={**os.environ, "KDD_NODE_MODULES": modules},
                            check=True, capture_output=True, text=True)
    return json.loads(answer.stdout)


def main():
    if len(sys.argv) < 4:
        sys.exit(__doc__)
    kdd = os.path.abspath(os.path.join(sys.argv[1], "src/tools/kdd/kdd"))
    viewer, modules = sys.argv[2], os.path.abspath(sys.argv[3])
    visits = int(sys.argv[4]) if len(sys.argv) > 4 else 5
    with comparison("first-picture") as (folder, servers):
        files = make_archive(kdd, folder)
        add(kdd, folder, files)
        archives = [start_kdd(kdd, folder)]
        servers += archives
        peer = start_peer(folder, files)
        if peer:
            archives.append(peer)
            servers.append(peer)
        fronts = [start_front(folder, viewer, each) for each in archives]
        servers += fronts
        found = [[] for _ in archives]
        spent = [each.cpu() for each in archives]
        for _ in range(visits):
            for number, front in enumerate(fronts):
                found[number].append(visit(front, modules))
        rows = list(found[0][0])
        print("| server | %s | CPU of a visit |\n|---|%s" % (" | ".join(rows), "---|" * (len(rows) + 1)))
        for server, times, before in zip(archives, found, spent):
            medians = [statistics.median(each[row] for each in times) for row in rows]
            print("| %s | %s | %.0f |" % (server.name, " | ".join("%d" % each for each in medians),
                                          (server.cpu() - before) * 1000 / visits))


if __name__ == "__main__":
    main()
