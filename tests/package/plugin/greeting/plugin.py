"""Refuses a greeting whose text is blank; applying needs no work."""


def validate(request, host):
    findings = []
    for item in host.items(request):
        text = item["config"].get("text", "") if isinstance(item["config"], dict) else ""
        if not text.strip():
            findings.append({"field": "/demo/greeting/message/text",
                             "errors": [{"id": "com.example.greeting.blank", "args": [],
                                         "message": "a greeting says something"}]})
    return findings


def apply(request, host):
    return None
